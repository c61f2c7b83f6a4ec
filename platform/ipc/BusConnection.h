// The daemon end of one connection. Private to platform/ipc.
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

/// An accepted connection. `resume` starts its thread, which holds a reference to it, serves its calls and
/// finally, in this order: runs the interruption handler if the connection broke, runs the invalidation
/// handler, releases the handlers and the exported object (which may destroy a session here, and take
/// seconds), sends what that left in the outbox, and closes the bus. If never resumed, it only closes the
/// socket and runs no handler.
class BusConnection final : public IPCConnection, public std::enable_shared_from_this<BusConnection> {
 public:
  /// A message's content is limited to `maximumMessage`; exceeding it gives an error that names the limit.
  /// The rest of the message is limited to this many more bytes; exceeding that closes the connection.
  static constexpr std::size_t kMessageOverhead = 64 * 1024;
  /// Limit in bytes on answers and calls that wait for the client to read, beyond its socket's buffer. Once
  /// it is reached no calls are served, so a client that calls without reading its answers blocks itself.
  static constexpr std::size_t kMaximumUnsent = 224 * 1024;
  /// When a connection is invalidated, calls that the client had already sent are still served for this long.
  static constexpr std::chrono::milliseconds kDrainTime{1'000};
  /// When the connection is ended from this side, pending bytes are written for up to this time.
  static constexpr std::chrono::milliseconds kFlushTime{1'000};

  /// `registry` has admitted it under `serial`, and is notified when the connection ends.
  BusConnection(FileDescriptor socket, std::uint64_t serial, const IPCPeer& peer,
                std::shared_ptr<ConnectionRegistry> registry);
  ~BusConnection() override { close(); }

  /// For the listener: like `invalidate`, and closes the socket if there is no thread.
  void end();

  std::string description() const override { return _name; }
  IPCPeer peer() const override { return _peer; }
  void resume(IPCHandlers handlers) override;
  void setPaused(bool isPaused) override;
  void invalidate() override;
  void callRemoteObject(IPCOutgoingCall call,
                        const std::function<void(const std::string& error)>& errorHandler) override;

 private:
  using Time = std::chrono::steady_clock::time_point;

  enum class End {
    HungUp,            ///< the client closed the connection
    BrokenOff,         ///< in mid-message, by an error, or because the client violated the protocol
    Invalidated,       ///< from this side
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
  /// Whether no calls may be served now.
  bool mustWait() const noexcept {
    return isBackedUp() || (_paused.load() && !_peerGone && !_invalidated.load());
  }

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

  // Thread-safe by themselves.
  std::atomic<bool> _started{false};
  std::atomic<bool> _paused{false};
  std::atomic<bool> _invalidated{false};
  std::atomic<bool> _counted{true};

  // Set before `resume`, then used only by the thread.
  FileDescriptor _socket;
  CallRouter _router;
  IPCHandlers _handlers;  // except for the objects, which the router has

  // Used only by the thread.
  SaslServer _sasl;
  Channel _channel;
  bool _isReady = false;   // the client has authenticated and begun
  bool _hasMore = false;   // messages have arrived that are not served yet
  bool _peerGone = false;  // nothing more can be sent
  WarningBurst _brokenMessages;
};

}  // namespace vesk
