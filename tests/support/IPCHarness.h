// A listener with recording sessions behind it, and clients that are driven by hand.
#pragma once

#include <condition_variable>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "client/protocol/ClientSessionInterface.h"
#include "client/protocol/WireNames.h"
#include "platform/ipc/BusClient.h"
#include "platform/ipc/IPCListener.h"

namespace vesk::test {

/// Lines in the order in which they happened, on whatever thread.
class Journal {
 public:
  void add(std::string line);
  /// Waits until `count` lines begin with `beginning`; false when that takes half a minute.
  bool waitFor(std::string_view beginning, std::size_t count = 1);
  std::size_t count(std::string_view beginning);
  std::vector<std::string> lines();

 private:
  std::size_t countLocked(std::string_view beginning) const;
  std::mutex _mutex;
  std::condition_variable _changed;
  std::vector<std::string> _lines;
};

/// Journals each call. A message's "do" decides what becomes of it: "throw", "abandon", "keep" (answered
/// later, by the test), "farewell" (the destruction calls the client); else it is answered with its "n" and
/// as many dots as its "pad" says.
class RecordingSession final : public ClientSessionInterface {
 public:
  RecordingSession(Journal& journal, std::shared_ptr<IPCConnection> connection)
      : _journal(journal), _connection(std::move(connection)) {}
  ~RecordingSession() override;

  void setSessionInfo(const Dictionary& sessionInfo, const std::optional<Dictionary>& userInfo,
                      const List& frameworksToCheck, bool hasAggregationBlock) override;
  void startConfigWithCompletionHandler(Reply<std::optional<BackendNames>> reply) override;
  void fetchStatesWithUserInfo(const std::optional<Dictionary>& userInfo,
                               Reply<std::optional<BackendNames>> completionHandler) override;
  void fetchDisplayURL(Reply<std::string> reply) override;
  void sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                               const std::optional<Dictionary>& payload,
                               Reply<std::optional<std::string>> reply) override;
  void sendMessageWithDictionary(const Dictionary& parameters,
                                 Reply<std::optional<std::string>> reply) override;
  void flushMessagesWithReply(Reply<std::optional<std::string>> reply) override;
  void uploadFileAtPath(const std::string& fileURL, const std::string& extensionToken,
                        Reply<bool> completionHandler) override;
  void uploadLogData(const List& logData, Reply<bool, std::optional<std::string>> completionHandler) override;
  void sendMessageWithSessionInfo(const Dictionary& sessionInfo, const std::optional<Dictionary>& userInfo,
                                  std::uint16_t category, std::uint16_t type,
                                  const std::optional<Dictionary>& payload,
                                  Reply<std::string> reply) override;

  Reply<std::optional<std::string>> kept;

 private:
  Journal& _journal;
  const std::shared_ptr<IPCConnection> _connection;
  bool _saysFarewell = false;
};

/// The daemon's side. `adjust` changes the listener's options.
class TestService : public IPCListenerDelegate {
 public:
  enum class Accept { Resume, NotResume, Refuse };

  explicit TestService(const std::function<void(IPCListener::Options&)>& adjust = {});
  ~TestService() override;

  bool shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) override;

  const std::string& path() const { return _path; }
  IPCListener& listener() { return *_listener; }
  /// The connection accepted as the `index`th, while somebody holds it.
  std::shared_ptr<IPCConnection> connection(std::size_t index = 0);
  std::shared_ptr<RecordingSession> session(std::size_t index = 0);

  Accept accept = Accept::Resume;
  std::function<void()> onInvalidation;
  Journal journal;

 private:
  std::string _directory;
  std::string _path;
  std::mutex _mutex;
  std::vector<std::weak_ptr<IPCConnection>> _connections;
  std::vector<std::weak_ptr<RecordingSession>> _sessions;
  std::unique_ptr<IPCListener> _listener;
};

/// A client of the library's kind, run by the test's thread.
class TestClient : public IPCExportedObject {
 public:
  explicit TestClient(const TestService& service);
  explicit TestClient(const std::string& socketPath);

  const char* interfaceName() const override { return wire::kReplyInterface; }
  void handle(IPCIncomingCall& call) override;

  /// Runs the client until the predicate holds; false when it takes half a minute or the connection ends.
  bool runUntil(const std::function<bool()>& predicate);
  /// Runs the client until the connection has ended.
  bool runToEnd();

  /// The answer's texts in one line, or the last part of the error's name.
  std::string call(const char* member, std::vector<IPCArgument> arguments = {},
                   const char* interfaceName = wire::kSessionInterface);
  void post(const char* member, std::vector<IPCArgument> arguments = {});

  BusClient& bus() { return *_bus; }
  std::vector<std::string> received;

 private:
  std::shared_ptr<TestClient> _self{this, [](TestClient*) {}};
  std::unique_ptr<BusClient> _bus;
};

/// A client that writes bytes.
class RawClient {
 public:
  explicit RawClient(const TestService& service);

  int fd() const { return _socket.get(); }
  void send(std::string_view bytes);
  /// One line of the authentication's answers; empty when the connection ended.
  std::string line();
  void authenticate();
  /// Waits for the other end to close.
  bool isClosed();
  void close() { _socket.reset(); }

  struct Header {
    bool bigEndian = false;
    std::uint32_t descriptors = 0;
  };
  /// A call as it goes over the wire.
  static std::string message(const char* member, const char* signature, const std::string& body,
                             Header header);
  static std::string message(const char* member, const char* signature, const std::string& body) {
    return message(member, signature, body, {});
  }
  /// The body of an a{sv} with one byte string.
  static std::string bytesDictionary(std::size_t size);

 private:
  FileDescriptor _socket;
};

/// Collects the log's lines while it lives.
class LogCapture {
 public:
  LogCapture();
  ~LogCapture();
  Journal& lines() { return *_lines; }

 private:
  std::shared_ptr<Journal> _lines = std::make_shared<Journal>();
};

}  // namespace vesk::test
