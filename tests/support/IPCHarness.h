// A listener with recording sessions, and clients that tests drive directly.
#pragma once

#include "platform/ipc/BusClient.h"
#include "platform/ipc/IPCListener.h"
#include "tests/support/RecordingSession.h"
#include "tests/support/TempDirectory.h"
#include "tests/support/WireMessage.h"

namespace vesk::test {

/// The entry "do" of a message selects its treatment: "throw", "abandon", or "farewell" (the destructor calls
/// the client). Otherwise the answer is the entry "n" followed by as many dots as the entry "pad" says. The
/// test takes care of tokens.
class ActingSession final : public RecordingSession {
 public:
  ActingSession(Record& record, std::shared_ptr<IPCConnection> connection)
      : RecordingSession(record), _connection(std::move(connection)) {}
  ~ActingSession() override;

  void sendMessageWithDictionary(const Dictionary& parameters,
                                 Reply<std::optional<std::string>> reply) override;
  void uploadFileAtPath(const std::string& fileURL, const std::string& extensionToken,
                        Reply<bool> completionHandler) override;

 private:
  const std::shared_ptr<IPCConnection> _connection;
  bool _saysFarewell = false;
};

/// The daemon's side. `adjust` changes the listener's options.
class TestService : public IPCListenerDelegate {
 public:
  explicit TestService(const std::function<void(IPCListener::Options&)>& adjust = {});

  bool shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) override;

  const std::string& path() const { return _path; }
  IPCListener& listener() { return *_listener; }
  /// The `index`th accepted connection, or null if it has been destroyed.
  std::shared_ptr<IPCConnection> connection(std::size_t index = 0);

  std::function<void()> onInvalidation;
  Record journal;

 private:
  TempDirectory _directory;
  std::string _path;
  std::mutex _mutex;
  std::vector<std::weak_ptr<IPCConnection>> _connections;
  std::unique_ptr<IPCListener> _listener;
};

/// A client as in the library, run on the test's thread.
class TestClient : public IPCExportedObject {
 public:
  explicit TestClient(const TestService& service);
  explicit TestClient(const std::string& socketPath);

  const char* interfaceName() const override { return wire::kReplyInterface; }
  void handle(IPCIncomingCall& call) override;

  /// Runs the client until the predicate holds. Returns false after half a minute or if the connection ends.
  bool runUntil(const std::function<bool()>& predicate);
  /// Runs the client until the connection ends.
  bool runToEnd();

  /// Calls and returns the answer's texts in one line, or the last part of the error's name.
  std::string call(const char* member, std::vector<IPCArgument> arguments = {},
                   const char* interfaceName = wire::kSessionInterface);
  void post(const char* member, std::vector<IPCArgument> arguments = {});

  BusClient& bus() { return *_bus; }
  std::vector<std::string> received;

 private:
  std::shared_ptr<TestClient> _self{this, [](TestClient*) {}};
  std::unique_ptr<BusClient> _bus;
};

/// A client that writes raw bytes.
class RawClient {
 public:
  explicit RawClient(const TestService& service) : RawClient(service.path()) {}
  explicit RawClient(const std::string& socketPath);

  int fd() const { return _socket.get(); }
  void send(std::string_view bytes);
  /// One line of the authentication's answers; empty if the connection has ended.
  std::string line();
  void authenticate();
  /// Waits for the peer to close.
  bool isClosed();
  void close() { _socket.reset(); }

  /// The body of an a{sv} with one byte string.
  static std::string bytesDictionary(std::size_t size, int depth = 0);

 private:
  FileDescriptor _socket;
};

}  // namespace vesk::test
