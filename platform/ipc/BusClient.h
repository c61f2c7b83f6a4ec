// The client end of a connection: calls the daemon and receives its calls.
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

/// The answer to a call: its arguments, or an error. Valid while its handler runs.
class BusAnswer {
 public:
  /// An answer with arguments.
  explicit BusAnswer(MessageReader& arguments) noexcept : _arguments(&arguments) {}
  /// An error, whose texts must outlive this object.
  BusAnswer(std::string_view errorName, std::string_view errorText) noexcept
      : _errorName(errorName), _errorText(errorText) {}

  bool isError() const noexcept { return _arguments == nullptr; }
  /// The D-Bus error name. "org.freedesktop.DBus.Error.NoReply" is also used after a timeout, and
  /// "org.freedesktop.DBus.Error.Disconnected" if the connection ended first.
  std::string_view errorName() const noexcept { return _errorName; }
  std::string_view errorText() const noexcept { return _errorText; }

  /// Reads the next argument (types: see MessageReader::read). Returns false for an error or a wrong type.
  template <class T>
  bool read(T& out) {
    return _arguments && _arguments->read(out);
  }

  /// Like `read`, but the next `read` gives the same argument.
  template <class T>
  bool peek(T& out) const {
    if (!_arguments) return false;
    MessageReader copy(*_arguments);
    return copy.read(out);
  }

 private:
  MessageReader* _arguments = nullptr;
  std::string_view _errorName;
  std::string_view _errorText;
};

/// Owned and used by one thread, whose poll loop waits for `fd` with `events` and `timeout` and then calls
/// `process`. Never blocks. Calls made before authentication is complete are queued.
class BusClient {
 public:
  struct Options {
    std::string socketPath;    ///< the daemon's socket, used unless `connected` is given
    FileDescriptor connected;  ///< a connected stream socket
    std::string objectPath;    ///< of both the called and the exported object
  };

  enum class SendResult {
    Sent,     ///< written or queued
    Refused,  ///< the arguments are too large, nested too deeply or not valid text; every receiver would
              ///< refuse them
    OutOfResources,  ///< out of memory or descriptors; nothing was sent
    Disconnected     ///< the connection has ended; create a new BusClient
  };

  enum class Progress { Connected, Disconnected };

  /// Called exactly once, from `process`; if the connection ends before the answer, possibly from `write` or
  /// the destructor. May send. Must not call `process` or `write`, destroy the client, or throw.
  using AnswerHandler = std::function<void(BusAnswer& answer)>;

  /// Connects. Throws std::system_error: ENOENT or ECONNREFUSED if there is no daemon, EAGAIN if too many
  /// clients wait to be accepted.
  explicit BusClient(Options options);
  ~BusClient() { end(); }
  BusClient(const BusClient&) = delete;
  BusClient& operator=(const BusClient&) = delete;

  /// Receives the daemon's calls, within `process`. `IPCIncomingCall`s may be answered.
  void setExportedObject(std::shared_ptr<IPCExportedObject> object) {
    _router.setExportedObject(std::move(object));
  }

  /// Sends immediately as much as the socket takes. `handler` gets the answer, or an error after `timeout`;
  /// without a handler the call is one-way. The handler is destroyed unless the call was sent.
  [[nodiscard]] SendResult send(const IPCEncodedCall& call, AnswerHandler handler = nullptr,
                                std::chrono::milliseconds timeout = {});
  [[nodiscard]] SendResult send(const IPCOutgoingCall& call, AnswerHandler handler = nullptr,
                                std::chrono::milliseconds timeout = {});
  /// Adds a one-way call to those that `write` sends together, which is the cheap way to send many. Once the
  /// socket is full, they wait here. A sender that must not lose them with the connection keeps copies until
  /// `queuedMessages` shows that they were sent.
  [[nodiscard]] SendResult add(const IPCEncodedCall& call) { return append(call, false); }
  [[nodiscard]] Progress write();
  /// Bytes and messages that the socket has not taken. They are not limited here; the sender must hold back
  /// if there are many.
  std::size_t addedBytes() const noexcept { return _channel.unsentBytes(); }
  std::size_t queuedMessages() const noexcept { return _channel.unsentMessages(); }
  /// Whether authentication is complete.
  bool isReady() const noexcept { return _isReady; }
  /// Returns true if disconnected because the daemon has too many connections.
  bool wasTurnedAway() const noexcept { return _sasl.refusal() == kTooManyConnections; }

  int fd() const { return isOurs() ? _socket.get() : -1; }
  short events() const;
  /// For poll(), in milliseconds; -1 for no limit.
  int timeout() const;
  /// Writes what is queued, reads what has arrived, calls handlers and the exported object. Does a limited
  /// amount of work; `timeout` returns 0 if more is left.
  [[nodiscard]] Progress process();

 private:
  using Time = std::chrono::steady_clock::time_point;

  struct Owed {
    AnswerHandler handler;
    Time deadline;
  };
  using OwedAnswers = std::map<std::uint32_t, Owed>;  // by serial number of the call

  SendResult append(const IPCEncodedCall& call, bool expectsReply);
  /// A process forked from this one shares the socket but does not own the connection.
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
  GuardedDescriptor _socket;  // empty after the connection has ended
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
