// What a connection's thread does from authentication to the end. Private to platform/ipc.
#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <optional>
#include <string>

#include "platform/ipc/BusHandles.h"
#include "platform/ipc/BusRelay.h"
#include "platform/ipc/BusReplies.h"
#include "platform/ipc/CallRouter.h"
#include "platform/ipc/IPCConnection.h"
#include "platform/ipc/Outbox.h"
#include "platform/ipc/Wakeup.h"
#include "platform/ipc/WarningBurst.h"

namespace vesk {

struct ConnectionSettings {
  std::string objectPath;
  std::size_t maximumMessage = 0;
  std::size_t maximumOutbox = 0;
  std::chrono::milliseconds authenticationTimeout{0};
};

/// Owns the bus. Made, used and destroyed on the connection's thread, which it stays on its stack of: what it
/// refers to belongs to the connection and outlives it.
class ConnectionLoop {
 public:
  /// The content of a message is limited to `maximumMessage`, with an error that names the limit; the bytes
  /// around it, by closing the connection, to this much more.
  static constexpr std::size_t kMessageOverhead = 64 * 1024;
  /// What a client had sent when its connection was invalidated is still served, for this long.
  static constexpr std::chrono::milliseconds kDrainTime{1'000};

  enum class End {
    HungUp,            ///< the client closed the connection
    BrokenOff,         ///< in mid-message, by an error, or because the client broke the rules
    Invalidated,       ///< from this end
    NotAuthenticated,  ///< before a call could be received
  };

  /// Throws std::system_error.
  ConnectionLoop(int socket, const IPCPeer& peer, const std::string& name, const ConnectionSettings& settings,
                 Outbox& outbox, const Wakeup& wakeup, BusReplies& replies, CallRouter& router);
  /// Closes the replies, which can go nowhere without the bus.
  ~ConnectionLoop();

  End serve(const std::atomic<bool>& invalidated);

  /// Sends what is in the outbox and what the bus has queued, as far as the client takes it within `limit`.
  void flush(std::chrono::milliseconds limit);

 private:
  using Time = std::chrono::steady_clock::time_point;

  bool isReady() const;
  /// Whether what the client has not read has filled the sockets. Then nothing more is served or sent, so
  /// that one that calls without reading its answers waits itself, and costs no more than one message.
  bool isBackedUp() const;
  bool sendOutgoing();
  bool sendCall(const IPCOutgoingCall& call);
  void wait(Time deadline);
  bool mayRead() const;
  std::optional<End> advance();
  bool process();
  bool processWaiting();
  void noteBrokenMessages();
  End drain();
  End endOfBus() const;

  const int _socket;
  const std::string& _name;
  const ConnectionSettings& _settings;
  Outbox& _outbox;
  const Wakeup& _wakeup;
  BusReplies& _replies;
  CallRouter& _router;
  BusRelay _relay;
  BusHandle _bus;
  bool _peerGone = false;
  std::uint64_t _messagesSeen = 0;
  WarningBurst _brokenMessages;
};

}  // namespace vesk
