// What a connection's thread does from authentication to the end. Private to platform/ipc.
#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <optional>
#include <string>

#include "platform/ipc/Answers.h"
#include "platform/ipc/CallRouter.h"
#include "platform/ipc/Channel.h"
#include "platform/ipc/IPCConnection.h"
#include "platform/ipc/MessageWriter.h"
#include "platform/ipc/Outbox.h"
#include "platform/ipc/Sasl.h"
#include "platform/ipc/Wakeup.h"
#include "platform/ipc/WarningBurst.h"

namespace vesk {

struct ConnectionSettings {
  std::string objectPath;
  std::size_t maximumMessage = 0;
  std::size_t maximumOutbox = 0;
  std::chrono::milliseconds authenticationTimeout{0};
};

/// Lives on the stack of the connection's thread. What it refers to belongs to the connection and outlives
/// it.
class ConnectionLoop {
 public:
  /// The content of a message is limited to `maximumMessage`, with an error that names the limit; the bytes
  /// around it, by closing the connection, to this much more.
  static constexpr std::size_t kMessageOverhead = 64 * 1024;
  /// Answers and calls that wait for the client to read beyond what its socket holds. Beyond that nothing
  /// more is served, so a client that calls without reading its answers waits itself.
  static constexpr std::size_t kMaximumUnsent = 224 * 1024;
  /// What a client had sent when its connection was invalidated is still served, for this long.
  static constexpr std::chrono::milliseconds kDrainTime{1'000};

  enum class End {
    HungUp,            ///< the client closed the connection
    BrokenOff,         ///< in mid-message, by an error, or because the client broke the rules
    Invalidated,       ///< from this end
    NotAuthenticated,  ///< before a call could be received
  };

  ConnectionLoop(int socket, const IPCPeer& peer, const std::string& name, const ConnectionSettings& settings,
                 Outbox& outbox, const Wakeup& wakeup, Answers& answers, CallRouter& router) noexcept;
  /// Closes the answers, which can go nowhere without the channel.
  ~ConnectionLoop();

  End serve(const std::atomic<bool>& invalidated);

  /// Sends what is in the outbox and the channel, as far as the client takes it within `limit`.
  void flush(std::chrono::milliseconds limit);

 private:
  using Time = std::chrono::steady_clock::time_point;

  bool isBackedUp() const noexcept { return _channel.unsentBytes() > 0; }
  bool mayRead() const noexcept { return !isBackedUp(); }
  void sendOutgoing();
  bool appendCall(const IPCOutgoingCall& call);
  void wait(Time deadline);
  std::optional<End> advance();
  std::optional<End> authenticate();
  std::optional<End> serveMessages();
  End closeFor(const char* complaint);
  End drain();

  const int _socket;
  const std::string& _name;
  const ConnectionSettings& _settings;
  Outbox& _outbox;
  const Wakeup& _wakeup;
  Answers& _answers;
  CallRouter& _router;
  CallWriter _writer;
  SaslServer _sasl;
  Channel _channel;
  std::uint32_t _lastSerial = 0;
  bool _isReady = false;   // the client has authenticated itself and begun
  bool _hasMore = false;   // messages have come that are not served yet
  bool _peerGone = false;  // nothing can be sent any more
  WarningBurst _brokenMessages;
};

}  // namespace vesk
