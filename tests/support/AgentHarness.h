// An agent with real backends and a real collector. Tests drive its sessions directly.
#pragma once

#include <map>

#include "daemon/ReportingdAgent.h"
#include "tests/support/BackendHarness.h"

namespace vesk::test {

/// A connection without a peer. Stores the handlers, and the calls sent to the client.
class RecordingConnection final : public IPCConnection {
 public:
  std::string description() const override { return "recording connection"; }
  IPCPeer peer() const override { return {}; }
  void resume(IPCHandlers handlers) override {
    lose = std::exchange(handlers.loss, nullptr);
    _handlers = std::move(handlers);
  }
  void setPaused(bool paused) override { isPaused = paused; }
  void invalidate() override {
    if (auto handler = std::exchange(_handlers.invalidation, nullptr)) handler();
    _handlers = {};
  }
  void interrupt() { _handlers.interruption(); }
  /// The messages sent to the client, each as "102: 1700000000.000000 3/2 {a: text}" (sender, time, contents)
  /// or "closing: 0.000000 0/0".
  std::vector<std::string> told() const {
    std::vector<std::string> lines;
    for (const auto& call : calls) {
      const auto at = [&]<class T>(std::size_t i, T) { return std::get<T>(call.arguments.at(i)); };
      const auto from = at(0, std::optional<Dictionary>()), payload = at(4, std::optional<Dictionary>());
      std::string line = from ? describe(*from->find(kVeskReportingSessionInfoSessionID)) : "closing";
      line += ": " + std::to_string(at(1, 0.0)) + " ";
      line += std::to_string(at(2, std::uint16_t())) + "/" + std::to_string(at(3, std::uint16_t()));
      lines.push_back(line + (payload ? " " + describe(*payload) : ""));
    }
    return lines;
  }
  void callRemoteObject(IPCOutgoingCall call,
                        const std::function<void(const std::string& error)>& errorHandler) override {
    if (clientIsGone) return errorHandler("gone");
    calls.push_back(std::move(call));
    if (onCall) onCall(calls.back());
  }

  std::vector<IPCOutgoingCall> calls;
  std::function<void(std::size_t)> lose;  ///< reports calls that were never sent
  bool clientIsGone = false;
  std::atomic<bool> isPaused = false;
  std::function<void(const IPCOutgoingCall&)> onCall;  ///< by the sender, who may hold the agent's monitor

 private:
  IPCHandlers _handlers;
};

class AgentHarness;

/// A session and its connection, which ends with it.
struct DrivenSession {
  explicit DrivenSession(AgentHarness& harness);
  ~DrivenSession() {
    if (session) agent->sessionInvalidated(session);
  }
  DrivenSession(DrivenSession&&) = default;

  std::shared_ptr<ReportingdAgent> agent;
  std::shared_ptr<RecordingConnection> connection = std::make_shared<RecordingConnection>();
  std::shared_ptr<ReportingdSession> session;

  ReportingdSession* operator->() const { return session.get(); }

  std::optional<BackendNames> start() {
    return answer<BackendNames>([&](auto to) { session->startConfigWithCompletionHandler({to, {}}); });
  }
  std::optional<BackendNames> states(const std::optional<Dictionary>& userInfo) {
    return answer<BackendNames>([&](auto to) { session->fetchStatesWithUserInfo(userInfo, {to, {}}); });
  }
  std::optional<std::string> flush() {
    return answer<std::string>([&](auto to) { session->flushMessagesWithReply({to, {}}); });
  }
  std::optional<std::string> send(const Dictionary& parameters) {
    return answer<std::string>([&](auto to) { session->sendMessageWithDictionary(parameters, {to, {}}); });
  }

 private:
  template <class Answer, class Operation>
  static std::optional<Answer> answer(Operation operation) {
    std::optional<Answer> given;
    operation([&](const std::optional<Answer>& reply) { given = reply; });
    return given;
  }
};

inline Dictionary merged(const Dictionary& base, const Dictionary& more) {
  MutableDictionary all(base);
  all.setAll(more);
  return all.share();
}

class AgentHarness : public BackendHarness {
 public:
  AgentHarness()
      : agent(std::make_shared<ReportingdAgent>(
            sessionServices,
            [this](std::int32_t clientType, std::int32_t& maxAge, std::optional<std::string>& version, bool&,
                   std::optional<std::string>&, FetchFacts&) -> std::optional<Dictionary> {
              auto section = storebags.find(clientType);
              if (section == storebags.end()) return std::nullopt;
              maxAge = 3600;
              version = "bag-1";
              return section->second;
            },
            busyMarker)) {}

  DrivenSession newSession() { return DrivenSession(*this); }
  /// The session's own losses; backends count under their own names.
  std::uint64_t dropped(DropReason reason) const {
    std::uint64_t sum = 0;
    for (const auto& count : counters.snapshot())
      sum += count.backend == "session" && count.reason == reason ? count.count : 0;
    return sum;
  }

  SessionServices sessionServices{.backends = services, .libraryVersion = "7.3"};
  BusyMarker busyMarker;
  std::map<std::int32_t, Dictionary> storebags;  ///< sections by client type
  std::shared_ptr<ReportingdAgent> agent;
};

inline DrivenSession::DrivenSession(AgentHarness& harness)
    : agent(harness.agent),
      session(std::make_shared<ReportingdSession>(harness.agent, connection, harness.sessionServices)) {}

}  // namespace vesk::test
