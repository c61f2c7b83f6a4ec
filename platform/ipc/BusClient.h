// The client's end of a connection: calls the daemon and receives its calls.
#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/files/GuardedDescriptor.h"
#include "platform/ipc/CallRouter.h"
#include "platform/ipc/Channel.h"
#include "platform/ipc/IPCConnection.h"
#include "platform/ipc/MessageReader.h"
#include "platform/ipc/Outbox.h"
#include "platform/ipc/Sasl.h"

namespace vesk {

/// The answer to a call: its arguments, or an error. Lives while its handler runs.
class BusAnswer {
 public:
  /// Answered with arguments.
  explicit BusAnswer(MessageReader& arguments) noexcept : _arguments(&arguments) {}
  /// Answered with an error, whose texts outlive this.
  BusAnswer(std::string_view errorName, std::string_view errorText) noexcept
      : _errorName(errorName), _errorText(errorText) {}

  bool isError() const noexcept { return _arguments == nullptr; }
  /// D-Bus error name; "org.freedesktop.DBus.Error.NoReply" also when the time ran out and
  /// "org.freedesktop.DBus.Error.Disconnected" when the connection ended first.
  std::string_view errorName() const noexcept { return _errorName; }
  std::string_view errorText() const noexcept { return _errorText; }

  /// Reads the next argument (the types: MessageReader::read). False for an error and for a wrong type.
  template <class T>
  bool read(T& out) {
    return _arguments && _arguments->read(out);
  }

 private:
  MessageReader* _arguments = nullptr;
  std::string_view _errorName;
  std::string_view _errorText;
};

/// Owned and used by one thread, whose poll loop waits for `fd` with `events` and `timeout` and then calls
/// `process`. Nothing here waits. Calls made before authentication is done are queued.
class BusClient {
 public:
  struct Options {
    std::string socketPath;    ///< the daemon's socket, unless `connected` is given
    FileDescriptor connected;  ///< a connected stream socket
    std::string objectPath;    ///< of the object called, and of the one exported
  };

  enum class SendResult {
    Sent,            ///< written or queued
    Refused,         ///< the arguments are too large, too deep or no valid text: no receiver would take them
    OutOfResources,  ///< no memory or no descriptor was left for the message; nothing was sent
    Disconnected     ///< the connection has ended; make a new BusClient
  };

  enum class Progress { Connected, Disconnected };

  /// Called exactly once, from `process`; when the connection ends with the answer owed, it may be from
  /// `write` or the destructor. May send; must not call `process` or `write`, destroy the client, or throw.
  using AnswerHandler = std::function<void(BusAnswer& answer)>;

  /// Connects. Throws std::system_error: ENOENT or ECONNREFUSED when no daemon is there, EAGAIN when too many
  /// others wait to be accepted.
  explicit BusClient(Options options);
  ~BusClient() { end(); }
  BusClient(const BusClient&) = delete;
  BusClient& operator=(const BusClient&) = delete;

  /// Receives the daemon's calls, from `process`. Its `IPCIncomingCall`s may be answered.
  void setExportedObject(std::shared_ptr<IPCExportedObject> object) {
    _router.setExportedObject(std::move(object));
  }

  /// Sends at once what the socket takes. A `handler` gets the answer, or an error after `timeout`; without
  /// one the call is one-way. The handler is dropped unless the call was sent.
  [[nodiscard]] SendResult send(const IPCEncodedCall& call, AnswerHandler handler = nullptr,
                                std::chrono::milliseconds timeout = {});
  [[nodiscard]] SendResult send(const IPCOutgoingCall& call, AnswerHandler handler = nullptr,
                                std::chrono::milliseconds timeout = {});
  /// A one-way call, put with those that `write` writes together: the cheap way to send many. Once the socket
  /// is full they wait here; a sender that must not lose them with the connection keeps its own until
  /// `queuedMessages` says that they have left.
  [[nodiscard]] SendResult add(const IPCEncodedCall& call) { return append(call, false); }
  [[nodiscard]] Progress write();
  /// Bytes and messages that the socket has not taken. Nothing bounds them here: a sender holds back when
  /// there are many.
  std::size_t addedBytes() const noexcept { return _channel.unsentBytes(); }
  std::size_t queuedMessages() const noexcept { return _channel.unsentMessages(); }
  /// Whether authentication is done.
  bool isReady() const noexcept { return _isReady; }
  /// Disconnected because the daemon has too many connections.
  bool wasTurnedAway() const noexcept { return _sasl.refusal() == kTooManyConnections; }

  int fd() const { return isOurs() ? _socket.get() : -1; }
  short events() const;
  /// For poll(): milliseconds, -1 for no limit.
  int timeout() const;
  /// Writes what is queued, reads what has come, calls handlers and the exported object. Does so much at
  /// most; `timeout` is 0 when there is more.
  [[nodiscard]] Progress process();

 private:
  using Time = std::chrono::steady_clock::time_point;

  struct Owed {
    AnswerHandler handler;
    Time deadline;
  };
  using OwedAnswers = std::map<std::uint32_t, Owed>;  // by the number of the call

  SendResult append(const IPCEncodedCall& call, bool expectsReply);
  /// A process forked from this one has the socket too, but the connection is not its own.
  bool isOurs() const;
  bool hasEnded() const { return !_socket || !_socket.isOurs(); }
  bool authenticate();
  bool serve();
  void deliver(Message& message);
  void expire();
  void settle(OwedAnswers::iterator owed, BusAnswer answer);
  Progress disconnected();
  void end() noexcept;

  const pid_t _process;
  GuardedDescriptor _socket;  // none once the connection has ended
  const std::shared_ptr<Outbox> _outbox = std::make_shared<Outbox>();
  CallRouter _router;
  const std::string _objectPath;
  SaslClient _sasl;
  Channel _channel;
  OwedAnswers _owed;
  std::uint32_t _lastSerial = 0;
  bool _isReady = false;
  bool _hasMore = false;
};

}  // namespace vesk
