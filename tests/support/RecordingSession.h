// Sessions that only record their calls.
#pragma once

#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <functional>
#include <mutex>

#include "platform/ipc/ExtensionTokens.h"
#include "protocol/ClientSessionInterface.h"

namespace vesk::test {

/// Records the calls of a daemon's sessions, in order, and determines their answers. Outlives the daemon, so
/// that a test can start another one on the same socket. Thread-safe.
class Record {
 public:
  /// Answers are held until `release`.
  std::atomic<bool> holdsAnswers{false};
  /// Answers are dropped, so callers receive an error.
  std::atomic<bool> abandonsAnswers{false};

  /// Sets the answer of startConfig and fetchStates.
  void setBackends(std::optional<BackendNames> names) {
    std::lock_guard lock(_mutex);
    _backends = std::move(names);
  }
  std::optional<BackendNames> backends() const {
    std::lock_guard lock(_mutex);
    return _backends;
  }

  void hold(std::function<void()> answer) {
    std::lock_guard lock(_mutex);
    _held.push_back(std::move(answer));
  }
  void release() {
    std::vector<std::function<void()>> held;
    {
      std::lock_guard lock(_mutex);
      held.swap(_held);
    }
    for (auto& answer : held) answer();
  }

  void add(std::string line) {
    std::lock_guard lock(_mutex);
    _lines.push_back(std::move(line));
    _changed.notify_all();
  }
  std::vector<std::string> lines() const {
    std::lock_guard lock(_mutex);
    return _lines;
  }
  std::size_t count(std::string_view beginning) const {
    std::lock_guard lock(_mutex);
    return countLocked(beginning);
  }
  /// Waits up to a minute for that number of lines. Returns false if there are fewer.
  bool waitFor(std::string_view beginning, std::size_t number = 1) const {
    std::unique_lock lock(_mutex);
    return _changed.wait_for(lock, std::chrono::minutes(1), [&] { return countLocked(beginning) >= number; });
  }

 private:
  std::size_t countLocked(std::string_view beginning) const {
    return static_cast<std::size_t>(std::count_if(
        _lines.begin(), _lines.end(), [&](const auto& line) { return line.starts_with(beginning); }));
  }

  mutable std::mutex _mutex;
  mutable std::condition_variable _changed;
  std::optional<BackendNames> _backends = BackendNames{"httpPost", "wren"};
  std::vector<std::string> _lines;
  std::vector<std::function<void()>> _held;
};

inline std::string shown(const std::optional<Dictionary>& dictionary) {
  return dictionary ? describe(*dictionary) : "none";
}

class RecordingSession : public ClientSessionInterface {
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
    reply(!logData.empty(), std::nullopt);
  }
  void sendMessageWithSessionInfo(const Dictionary& sessionInfo, const std::optional<Dictionary>& userInfo,
                                  std::uint16_t category, std::uint16_t type,
                                  const std::optional<Dictionary>& payload,
                                  Reply<std::string> reply) override {
    _record.add("messageOnce " + describe(sessionInfo) + " " + shown(userInfo) + " " +
                std::to_string(category) + " " + std::to_string(type) + " " + shown(payload));
    answer(std::move(reply), std::string("finished"));
  }

 protected:
  Record& _record;

 private:
  template <class Answer>
  void answer(Reply<Answer> reply, Answer value) {
    if (_record.abandonsAnswers) return;
    if (!_record.holdsAnswers) return reply(value);
    auto kept = std::make_shared<Reply<Answer>>(std::move(reply));
    _record.hold([kept, value = std::move(value)] { (*kept)(value); });
  }
};

}  // namespace vesk::test
