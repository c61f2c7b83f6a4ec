#include "tests/support/RecordingDaemon.h"

#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <functional>
#include <utility>

#include "client/protocol/ClientSessionReplyProxy.h"
#include "client/protocol/ClientSessionStub.h"
#include "client/protocol/WireNames.h"
#include "platform/ipc/ExtensionTokens.h"

namespace vesk::test {

namespace {

std::string shown(const std::optional<Dictionary>& dictionary) {
  return dictionary ? describe(*dictionary) : "none";
}

class RecordingSession final : public ClientSessionInterface {
 public:
  explicit RecordingSession(Record& record) : _record(record) {}

  void setSessionInfo(const Dictionary& sessionInfo, const std::optional<Dictionary>& userInfo,
                      const List& frameworksToCheck, bool hasAggregationBlock) override {
    _record.add("setSessionInfo " + describe(sessionInfo) + " " + shown(userInfo) + " " +
                describe(frameworksToCheck) + (hasAggregationBlock ? " aggregating" : ""));
  }
  void startConfigWithCompletionHandler(Reply<std::optional<BackendNames>> reply) override {
    _record.add("startConfig");
    answer(std::move(reply), _record.backends());
  }
  void fetchStatesWithUserInfo(const std::optional<Dictionary>& userInfo,
                               Reply<std::optional<BackendNames>> reply) override {
    _record.add("fetchStates " + shown(userInfo));
    answer(std::move(reply), _record.backends());
  }
  void fetchDisplayURL(Reply<std::string> reply) override {
    _record.add("fetchDisplayURL");
    answer(std::move(reply), std::string("https://display.example/"));
  }
  void sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                               const std::optional<Dictionary>& payload,
                               Reply<std::optional<std::string>> reply) override {
    _record.add("message " + std::to_string(category) + " " + std::to_string(type) + " " + shown(payload));
    answer(std::move(reply), std::optional<std::string>("posted"));
  }
  void sendMessageWithDictionary(const Dictionary& parameters,
                                 Reply<std::optional<std::string>> reply) override {
    _record.add("parameters " + describe(parameters));
    answer(std::move(reply), std::optional<std::string>());
  }
  void flushMessagesWithReply(Reply<std::optional<std::string>> reply) override {
    _record.add("flush");
    answer(std::move(reply), std::optional<std::string>("posted all"));
  }
  void uploadFileAtPath(const std::string& fileURL, const std::string& extensionToken,
                        Reply<bool> reply) override {
    ExtensionHandle file = ExtensionTokens::shared().consume(extensionToken);
    char buffer[256];
    ssize_t size = ::read(file.descriptor.get(), buffer, sizeof buffer);
    _record.add("uploadFile " + fileURL + " " +
                std::string(buffer, size > 0 ? static_cast<std::size_t>(size) : 0));
    answer(std::move(reply), true);
  }
  void uploadLogData(const List& logData, Reply<bool, std::optional<std::string>> reply) override {
    _record.add("uploadLogData " + describe(logData));
    reply(true, std::nullopt);
  }
  void sendMessageWithSessionInfo(const Dictionary& sessionInfo, const std::optional<Dictionary>& userInfo,
                                  std::uint16_t category, std::uint16_t type,
                                  const std::optional<Dictionary>& payload,
                                  Reply<std::string> reply) override {
    _record.add("messageOnce " + describe(sessionInfo) + " " + shown(userInfo) + " " +
                std::to_string(category) + " " + std::to_string(type) + " " + shown(payload));
    answer(std::move(reply), std::string("finished"));
  }

 private:
  template <class Answer>
  void answer(Reply<Answer> reply, Answer value) {
    if (_record.abandonsAnswers) return;
    if (!_record.holdsAnswers) return reply(value);
    auto kept = std::make_shared<Reply<Answer>>(std::move(reply));
    _record.hold([kept, value = std::move(value)] { (*kept)(value); });
  }

  Record& _record;
};

}  // namespace

void Record::setBackends(std::optional<BackendNames> names) {
  std::lock_guard lock(_mutex);
  _backends = std::move(names);
}

std::optional<BackendNames> Record::backends() const {
  std::lock_guard lock(_mutex);
  return _backends;
}

void Record::add(std::string line) {
  std::lock_guard lock(_mutex);
  _lines.push_back(std::move(line));
  _changed.notify_all();
}

void Record::hold(std::function<void()> answer) {
  std::lock_guard lock(_mutex);
  _held.push_back(std::move(answer));
}

void Record::release() {
  std::vector<std::function<void()>> held;
  {
    std::lock_guard lock(_mutex);
    held.swap(_held);
  }
  for (auto& answer : held) answer();
}

std::vector<std::string> Record::lines() const {
  std::lock_guard lock(_mutex);
  return _lines;
}

std::size_t Record::count(std::string_view beginning) const {
  std::lock_guard lock(_mutex);
  return countLocked(beginning);
}

std::size_t Record::countLocked(std::string_view beginning) const {
  return static_cast<std::size_t>(std::count_if(
      _lines.begin(), _lines.end(), [&](const std::string& line) { return line.starts_with(beginning); }));
}

bool Record::waitForCount(std::string_view beginning, std::size_t number) const {
  std::unique_lock lock(_mutex);
  return _changed.wait_for(lock, std::chrono::minutes(1), [&] { return countLocked(beginning) >= number; });
}

RecordingDaemon::RecordingDaemon(const std::string& socketPath, Record& record)
    : _record(record), _listener([&] {
        IPCListener::Options options;
        options.socketPath = socketPath;
        options.objectPath = wire::kObjectPath;
        return options;
      }()) {
  _listener.setDelegate(this);
  _listener.resume();
}

RecordingDaemon::~RecordingDaemon() {
  {
    std::lock_guard lock(_mutex);
    _last.reset();
  }
  _listener.stop();
}

bool RecordingDaemon::shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) {
  connection->setExportedObject(
      std::make_shared<ClientSessionStub>(std::make_shared<RecordingSession>(_record)));
  {
    std::lock_guard lock(_mutex);
    _last = connection;
  }
  connection->resume();
  return true;
}

void RecordingDaemon::sendToClient(const std::optional<Dictionary>& sessionInfo, double timestamp,
                                   std::uint16_t category, std::uint16_t type,
                                   const std::optional<Dictionary>& payload) {
  std::lock_guard lock(_mutex);
  ClientSessionReplyProxy proxy(_last, [this](const std::string& error) { _record.add("error " + error); });
  proxy.sendMessageToClient(sessionInfo, timestamp, category, type, payload);
}

}  // namespace vesk::test
