// The daemon's end of one connection. Private to platform/ipc.
#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/CallRouter.h"
#include "platform/ipc/Channel.h"
#include "platform/ipc/ConnectionRegistry.h"
#include "platform/ipc/IPCConnection.h"
#include "platform/ipc/Outbox.h"
#include "platform/ipc/Sasl.h"
#include "platform/ipc/WarningBurst.h"
#include "platform/sync/Wakeup.h"

namespace vesk {

/// An accepted connection. `resume` gives it a thread, which holds it, serves its calls and in the end, in
/// this order: runs the interruption handler when the connection was broken off, runs the invalidation
/// handler, lets go of handlers and exported object (which may destroy a session here, and take seconds),
/// sends what that has left in the outbox, closes the bus. Never resumed, it just closes the socket and runs
/// no handler.
class BusConnection final : public IPCConnection, public std::enable_shared_from_this<BusConnection> {
 public:
  /// The content of a message is limited to `maximumMessage`, with an error that names the limit; the bytes
  /// around it, by closing the connection, to this much more.
  static constexpr std::size_t kMessageOverhead = 64 * 1024;
  /// Answers and calls that wait for the client to read beyond what its socket holds. Beyond that nothing
  /// more is served, so a client that calls without reading its answers waits itself.
  static constexpr std::size_t kMaximumUnsent = 224 * 1024;
  /// What a client had sent when its connection was invalidated is still served, for this long.
  static constexpr std::chrono::milliseconds kDrainTime{1'000};
  /// Bytes for the client that wait when the connection ends from this side are written for so long.
  static constexpr std::chrono::milliseconds kFlushTime{1'000};

  /// `registry` has admitted it under that number, and is told when this ends.
  BusConnection(FileDescriptor socket, std::uint64_t serial, const IPCPeer& peer,
                std::shared_ptr<ConnectionRegistry> registry);
  ~BusConnection() override { close(); }

  /// For the listener: as `invalidate`, and when there is no thread closes the socket.
  void end();

  std::string description() const override { return _name; }
  IPCPeer peer() const override { return _peer; }
  void resume(IPCHandlers handlers) override;
  void invalidate() override;
  void callRemoteObject(IPCOutgoingCall call,
                        const std::function<void(const std::string& error)>& errorHandler) override;

 private:
  using Time = std::chrono::steady_clock::time_point;

  enum class End {
    HungUp,            ///< the client closed the connection
    BrokenOff,         ///< in mid-message, by an error, or because the client broke the rules
    Invalidated,       ///< from this end
    NotAuthenticated,  ///< before a call could be received
  };

  void run() noexcept;
  End serve();
  void sendOutgoing();
  void wait(Time deadline);
  std::optional<End> advance();
  std::optional<End> authenticate();
  std::optional<End> serveMessages();
  End closeFor(const char* complaint);
  End drain();
  void flush();
  bool isBackedUp() const noexcept { return _channel.unsentBytes() > 0; }

  void finish(End how) noexcept;
  void callHandler(const std::function<void()>& handler) noexcept;
  void dropHandlers() noexcept;
  void close() noexcept;

  // Constant after construction.
  const std::uint64_t _serial;
  const IPCPeer _peer;
  const std::string _name;
  const std::shared_ptr<ConnectionRegistry> _registry;
  const std::shared_ptr<Wakeup> _wakeup = std::make_shared<Wakeup>();
  const std::shared_ptr<Outbox> _outbox;

  // Synchronised by themselves.
  std::atomic<bool> _started{false};
  std::atomic<bool> _invalidated{false};
  std::atomic<bool> _counted{true};

  // Set before `resume`, then the thread's.
  FileDescriptor _socket;
  CallRouter _router;
  IPCHandlers _handlers;  // but for the object, which the router has

  // The thread's.
  SaslServer _sasl;
  Channel _channel;
  bool _isReady = false;   // the client has authenticated itself and begun
  bool _hasMore = false;   // messages have come that are not served yet
  bool _peerGone = false;  // nothing can be sent any more
  WarningBurst _brokenMessages;
};

}  // namespace vesk
