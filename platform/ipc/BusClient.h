// The client's end of a connection: calls the daemon and receives its calls.
#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/IPCConnection.h"

struct sd_bus_message;

namespace vesk {

class BusDecoder;

/// The answer to a call: its arguments, or an error. Lives while its handler runs.
class BusAnswer {
 public:
  /// Answered with arguments.
  explicit BusAnswer(BusDecoder& arguments) noexcept : _arguments(&arguments) {}
  /// Answered with an error, whose texts outlive this.
  BusAnswer(std::string_view errorName, std::string_view errorText) noexcept
      : _errorName(errorName), _errorText(errorText) {}

  bool isError() const noexcept { return _arguments == nullptr; }
  /// D-Bus error name; "org.freedesktop.DBus.Error.NoReply" also when the time ran out and
  /// "org.freedesktop.DBus.Error.Disconnected" when the connection ended first.
  std::string_view errorName() const noexcept { return _errorName; }
  std::string_view errorText() const noexcept { return _errorText; }

  /// Reads the next argument (the types: BusDecoder::read). False for an error and for a wrong type.
  bool read(bool& out);
  bool read(std::string& out);
  bool read(std::optional<std::string>& out);
  bool read(std::optional<std::vector<std::string>>& out);
  bool read(std::optional<Dictionary>& out);

 private:
  BusDecoder* _arguments = nullptr;
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
  /// others wait to be accepted, EUSERS when too many are connected.
  explicit BusClient(Options options);
  ~BusClient();

  /// Receives the daemon's calls, from `process`. Its `IPCIncomingCall`s may be answered.
  void setExportedObject(std::shared_ptr<IPCExportedObject> object);

  /// One-way.
  [[nodiscard]] SendResult send(const IPCOutgoingCall& call);
  /// A one-way call without a descriptor, put with those that `write` writes together: the cheap way to send
  /// many. Once the socket is full they wait here; a sender that must not lose them with the connection keeps
  /// its own until `queuedMessages` says that they have left.
  [[nodiscard]] SendResult add(const IPCOutgoingCall& call);
  [[nodiscard]] Progress write();
  /// Bytes added that the socket has not taken.
  std::size_t addedBytes() const;
  /// With an answer, or an error after `timeout`. The handler is dropped unless the call was sent.
  [[nodiscard]] SendResult send(const IPCOutgoingCall& call, AnswerHandler handler,
                                std::chrono::milliseconds timeout);

  /// Messages that the socket has not taken yet. A sender holds back when there are many: sd-bus would queue
  /// without end.
  std::size_t queuedMessages() const;
  /// Whether authentication is done.
  bool isReady() const;
  /// Disconnected because the daemon has too many connections.
  bool wasTurnedAway() const;

  int fd() const;
  short events() const;
  /// For poll(): milliseconds, -1 for no limit.
  int timeout() const;
  /// Writes what is queued, reads what has come, calls handlers and the exported object. Does so much at
  /// most; `timeout` is 0 when there is more.
  [[nodiscard]] Progress process();

 private:
  class Implementation;
  std::unique_ptr<Implementation> _implementation;
};

}  // namespace vesk
