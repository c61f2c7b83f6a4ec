// The system log of sessions and the agent: every line, in order, in full and with its level.
#include <functional>

#include "tests/support/CapturedLog.h"
#include "tests/support/FamilyHarness.h"

namespace vesk::test {
namespace {

class SessionLog : public FamilyHarness {
 protected:
  /// The lines so far, each after its level, without those of units that have their own tests. Values in
  /// `names` are replaced by their names.
  std::string transcript() const {
    std::string text;
    for (const auto& [level, line] : log.lines()) {
      bool isForeign = false;
      for (const char* part :
           {"Backend(", "Filters(", "fetchAndCache", "Cached", "userDefaults", "compressData", "writeToLog"})
        isForeign = isForeign || line.find(part) != std::string::npos;
      if (!isForeign) text += std::to_string(level) + " " + line + "\n";
    }
    for (const auto& [name, value] : names)
      for (std::size_t at = 0; (at = text.find(value)) != std::string::npos;)
        text.replace(at, value.size(), name);
    return text;
  }

  CapturedLog log;
  std::vector<std::pair<const char*, std::string>> names{{"AGENT", harness.agent->description()}};
};

TEST_F(SessionLog, OfASession) {
  const Dictionary info{{kVeskReportingSessionInfoSessionID, 4'000'000'000},
                        {kVeskReportingSessionInfoClientType, 5}};
  const Dictionary parameters{{"category", 1}, {"type", 2}};
  DrivenSession session(harness);
  names.emplace_back("IDENTITY", session->sessionIDString());
  EXPECT_TRUE(names.back().second.size() == 24 && names.back().second.ends_with("=="));
  EXPECT_EQ(session.send(parameters), std::nullopt) << "before its start nothing takes anything";
  EXPECT_EQ(harness.dropped(DropReason::NoBackend), 1u);
  session.flush();
  session->uploadFileAtPath("file:///no%20file", "", {});
  session->uploadLogData({1, "b"}, {});
  session->setSessionInfo(sessionInfo(0), userInfo("MyApp"), {}, true);
  session->setSessionInfo(info, userInfo("MyApp"), {}, false);  // does not require its user info
  session->setSessionInfo(Dictionary(), {}, {}, false);
  EXPECT_EQ(session.start(), std::nullopt) << "without a client type there is no storebag";
  session->setSessionInfo(info, {}, {}, true);
  session.start();
  session->sendMessageWithCategory(1, 2, std::nullopt, {});
  session.send({});
  session.send(Dictionary{{"category", 1}});
  session.connection->clientIsGone = true;
  session.send(parameters);
  session.connection->clientIsGone = false;
  session->fetchDisplayURL({});
  session.states(userInfo("MyApp"));
  session.states(userInfo("MyApp"));
  session->sendMessageWithSessionInfo(info, userInfo("MyApp"), 1, 2, {}, {});
  session->sendMessageWithSessionInfo({}, {}, 1, 2, {}, {});
  createBackends({}, info, {}, "", "7.0", {}, harness.services);
  createBackends(info, {}, {}, "", "7.0", {}, harness.services);
  sendMessageWithSessionInfo(harness.sessionServices, {}, {}, {}, info, 1, 2, {});
  sendMessageWithSessionInfo(harness.sessionServices, {}, Dictionary(), {}, {}, 1, 2, {});
  session.connection->onCall = [](const IPCOutgoingCall&) { throw std::runtime_error("no memory"); };
  harness.agent->sessionInvalidated(std::exchange(session.session, nullptr));
  EXPECT_EQ(transcript(), R"(7 initWithSessionDelegate: ReportingdSession initWithSessionDelegate:AGENT
7 initWithSessionDelegate: Initialized session with UUID IDENTITY
7 sendMessageWithCategory: Sending message for session 0
7 sendMessageWithDictionary: No backends available to send message
7 flushMessagesWithReply: Flushing messages for session 0
7 flushMessages: No backends available to send message
7 uploadFileAtPath: Uploading file for session 0
3 uploadFileWithURL: File upload failed for /no file
7 uploadLogData: Uploading log data array: [1, "b"]
3 uploadLogData: Log data array upload failed
7 setSessionInfo: Configuring session 100
7 setSessionInfo: Configuring session 4000000000
4 setSessionInfo: Configure session: user info provided without requiring it
7 setSessionInfo: Configuring session 0
7 startConfigWithCompletionHandler: Starting configuration for session 0
7 storebagForSession: Retrieving storebag for session 0 with client type 0
4 storebagForSession: no storebag is for client type 0
7 setSessionInfo: Configuring session 4000000000
7 startConfigWithCompletionHandler: Starting configuration for session 4000000000
7 storebagForSession: Retrieving storebag for session 4000000000 with client type 5
7 createBackendsWithStorebag: Creating backends for session 4000000000
6 getAncestorWithAggregatorForSession: No user info found for session 4000000000
7 internalSendMessage: Sent internal message (method:0 respCode:0)
6 userInfoUpdatedForSession: No user info found for session 4000000000
6 updateDownstreamSessions: No user info found for session 4000000000
7 sendMessageWithCategory: Sending message for session 4000000000
6 getAncestorWithAggregatorForSession: No user info found for session 4000000000
7 sendMessageWithCategory: Sending message for session 4000000000
7 sendMessageWithDictionary: Missing mandatory parameter 'category'
7 sendMessageWithCategory: Sending message for session 4000000000
7 sendMessageWithDictionary: Missing mandatory parameter 'type'
7 sendMessageWithCategory: Sending message for session 4000000000
6 getAncestorWithAggregatorForSession: No user info found for session 4000000000
3 sendMessageWithDictionary: Failed to get remote object proxy: gone
7 fetchDisplayURL: Fetching display URL for session 4000000000
7 fetchStatesWithUserInfo: Fetching states for session 4000000000
7 receivedUserInfo: Received new user info for session 4000000000
7 userInfoUpdatedForSession: Adding session 4000000000 to list for userInfoKey myapp:calls
7 fetchStatesWithUserInfo: Fetching states for session 4000000000
7 sendMessageWithSessionInfo: Sending message with session info for session 4000000000
7 storebagForSession: Retrieving storebag for session 4000000000 with client type 5
7 sendMessageWithSessionInfo: Sending single message with sessionID 4000000000
4 sendMessageWithSessionInfo: user info provided without requiring it.
3 sendMessageWithSessionInfo: Could not retrieve identifiers from sessionInfo
3 createBackends: Attempted to create backends with nil storebag
3 createBackends: Attempted to create backends with nil session info
7 sendMessageWithSessionInfo: Sending single message with sessionID 0
3 RsendMessageWithSessionInfo: Attempted to send message with one or more nil parameters
7 sendMessageWithSessionInfo: Sending single message with sessionID 0
3 RsendMessageWithSessionInfo: Attempted to send message with one or more nil parameters
7 listener: Orvo connection to <ReportingdSession 4000000000 IDENTITY> was invalidated
7 dealloc: ReportingdSession dealloc: 4000000000
3 dealloc: ReportingdSession: no memory
7 shutdownSessionAggregation: Disable aggregation module for session 4000000000
3 dealloc: ReportingdSession: no memory
)");
}

TEST_F(SessionLog, OfTheAgent) {
  std::string all;
  auto note = [&](const std::function<void()>& act) {
    log.clear();
    act();
    all += transcript();
  };
  auto ask = [&](DrivenSession& session) {
    harness.agent->parentSessionIDStringForSession(*session.session);
    RecursiveMutexLock lock(harness.agent->monitor());
    harness.agent->parentSessionForChild(*session.session);
  };
  auto update = [&](DrivenSession& session) { harness.agent->updateDownstreamSessions(*session.session); };
  const auto connection = std::make_shared<RecordingConnection>();
  note([&] {
    harness.agent->shouldAcceptNewConnection(connection);
    const std::string last = log.lines().back().second;
    names.emplace_back("FIRST", last.substr(last.size() - 24));
    connection->interrupt();
    connection->invalidate();
  });
  auto child = join(1);
  note([&] { child.states(userInfo("MYAPP")); });
  auto top = join(0), grandchild = join(2);
  for (const auto& [name, session] : {std::pair("CHILD", &child), {"TOP", &top}, {"GRANDCHILD", &grandchild}})
    names.emplace_back(name, (*session)->sessionIDString());
  top->setSessionInfo(sessionInfo(0), userInfo("MyApp"), {}, true);
  grandchild->setSessionInfo(sessionInfo(2), userInfo("MyApp"), {}, true);
  note([&] { update(child); });
  auto last = join(3);
  harness.agent->sessionInvalidated(child.session);
  note([&] { ask(last); });
  child->setSessionInfo(sessionInfo(1), userInfo("Nobody"), {}, false);
  note([&] { ask(child); });
  last.states(userInfo("Nobody"));
  note([&] { ask(child); });
  child->setSessionInfo(sessionInfo(1), {}, {}, false);
  note([&] { harness.agent->userInfoUpdatedForSession(*child.session), update(child); });
  EXPECT_EQ(all, R"(7 listener: Accepting new Orvo connection recording connection, 0(0) connections.
7 initWithSessionDelegate: ReportingdSession initWithSessionDelegate:AGENT
7 initWithSessionDelegate: Initialized session with UUID FIRST
7 listener: Orvo connection to <ReportingdSession 0 FIRST> was interrupted
7 listener: Orvo connection to <ReportingdSession 0 FIRST> was invalidated
7 dealloc: ReportingdSession dealloc: 0
7 sendMessageWithDictionary: No backends available to send message
7 internalSendMessage: Sent internal message (method:0 respCode:1)
7 flushMessages: No backends available to send message
7 shutdownSessionAggregation: Disable aggregation module for session 0
7 fetchStatesWithUserInfo: Fetching states for session 101
7 receivedUserInfo: Received new user info for session 101
7 userInfoUpdatedForSession: Adding session 101 to list for userInfoKey myapp:calls
7 parentSessionIDStringForSession: Checking userInfoKey 'myapp:calls' for session 101
6 parentSessionIDStringForSession: Found a gap in hierarchy (one of parents missing): incomplete parentSessionID is ''
7 parentSessionForChild: Checking userInfoKey 'myapp:calls' for session 101
6 parentSessionForChild: Unable to find session with hierarchy of 0 for userInfoKey 'myapp:calls'
6 syncReportingStates: child session 101 (backend httpPost) is missing its parent
7 parentSessionIDStringForSession: Checking userInfoKey 'myapp:calls' for session 101
7 updateCombinedSessionID: Updating combined session ID 'TOP.CHILD' for session 101 backends
7 parentSessionForChild: Checking userInfoKey 'myapp:calls' for session 101
7 shutdownSessionAggregation: Disable aggregation module for session 101
7 updateDownstreamSessions: Updating combined session ID and syncing reporting states for session 102
7 parentSessionIDStringForSession: Checking userInfoKey 'myapp:calls' for session 102
7 updateCombinedSessionID: Updating combined session ID 'TOP.CHILD.GRANDCHILD' for session 102 backends
7 parentSessionForChild: Checking userInfoKey 'myapp:calls' for session 102
7 shutdownSessionAggregation: Disable aggregation module for session 102
7 parentSessionIDStringForSession: Checking userInfoKey 'myapp:calls' for session 103
6 parentSessionIDStringForSession: Found a gap in hierarchy (one of parents missing): incomplete parentSessionID is 'GRANDCHILD'
7 parentSessionForChild: Checking userInfoKey 'myapp:calls' for session 103
7 parentSessionIDStringForSession: Checking userInfoKey 'nobody:calls' for session 101
3 parentSessionIDStringForSession: ERROR: No sessions found for user info key nobody:calls
7 parentSessionForChild: Checking userInfoKey 'nobody:calls' for session 101
3 parentSessionForChild: ERROR: No sessions found for user info key nobody:calls
7 parentSessionIDStringForSession: Checking userInfoKey 'nobody:calls' for session 101
3 parentSessionIDStringForSession: ERROR: Session 101 not found for user info key nobody:calls
7 parentSessionForChild: Checking userInfoKey 'nobody:calls' for session 101
3 parentSessionForChild: ERROR: Session 101 not found for user info key nobody:calls
6 userInfoUpdatedForSession: No user info found for session 101
6 updateDownstreamSessions: No user info found for session 101
)");
}

}  // namespace
}  // namespace vesk::test
