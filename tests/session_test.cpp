// Sessions driven by hand: configuration, dispatch, answers, and their end.
#include <gtest/gtest.h>

#include "tests/support/AgentHarness.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/TestRoot.h"

namespace vesk::test {
namespace {

class Session : public ::testing::Test {
 protected:
  Session() {
    testRoot().write("etc/veskreporting/device.toml", "DeviceName = \"Phone\"\nProductType = \"Phone7,2\"\n");
    harness.storebags[5] = Dictionary{{"httpPost", profile("/post")}};
  }
  Dictionary profile(const char* path) {
    return Dictionary{{"clients", List{Dictionary{{"post_url", harness.url(path)}}}}};
  }
  DrivenSession configured(int clientType = 5) {
    auto session = harness.newSession();
    session->setSessionInfo(Dictionary{{kVeskReportingSessionInfoSessionID, 77},
                                       {kVeskReportingSessionInfoClientType, clientType}},
                            std::nullopt, {}, false);
    return session;
  }
  static Dictionary message(Value category, Value type, Dictionary payload = {}) {
    return Dictionary{{"category", category}, {"type", type}, {"payload", payload}};
  }
  static std::string messageLog() { return testRoot().readAll("var/mobile/Library/Logs/Dunmore/Retired"); }

  AgentHarness harness;
};

std::string displayURL(DrivenSession& session) {
  std::string url;
  session->fetchDisplayURL({[&](const std::string& reply) { url = reply; }, nullptr});
  return url;
}

TEST_F(Session, UnstartedAnswersNothing) {
  CapturedLog log;
  auto session = configured(4);
  EXPECT_EQ(session->sessionIDString().size(), 24u);
  EXPECT_TRUE(session->sessionIDString().ends_with("=="));
  EXPECT_EQ(session.start(), std::nullopt) << "no storebag for this client type";
  EXPECT_EQ(session.send(message(1, 2)), std::nullopt);
  EXPECT_EQ(log.count(7, "sendMessageWithDictionary: No backends available to send message"), 1);
  EXPECT_EQ(harness.dropped(DropReason::NoBackend), 1u);
  EXPECT_EQ(displayURL(session), "URL not available");
  bool uploaded = true;
  session->uploadFileAtPath("file:///tmp/a%20b", "", {[&](const bool& reply) { uploaded = reply; }, nullptr});
  EXPECT_FALSE(uploaded);
  EXPECT_EQ(log.count(3, "uploadFileWithURL: File upload failed for /tmp/a b"), 1);
  session->uploadLogData({1, 2}, {[&](const bool& reply, const auto&) { uploaded = reply; }, nullptr});
  EXPECT_EQ(log.count(7, "uploadLogData: Uploading log data array: [1, 2]"), 1);
  EXPECT_EQ(log.count(3, "uploadLogData: Log data array upload failed"), 1);
  EXPECT_EQ(harness.dropped(DropReason::UploadFailed), 2u);
  session.session.reset();
  EXPECT_TRUE(harness.posts().empty());
}

TEST_F(Session, WhatAClientCallsItsFileFillsNoLog) {
  CapturedLog log;
  auto session = configured(4);
  const std::string before = messageLog();
  for (const std::string& url : {std::string("file:///a%20b(\n(2026) [forged] \xc3\xa9"),
                                 "file://host" + std::string(1 << 20, '\n'), std::string(1 << 20, 'x')}) {
    session->uploadFileAtPath(url, "", {[](const bool& reply) { EXPECT_FALSE(reply); }, nullptr});
  }
  const std::string written = messageLog().substr(before.size());
  EXPECT_EQ(std::count(written.begin(), written.end(), '\n'), 3);
  EXPECT_LT(written.size(), 2000u);
  EXPECT_NE(written.find("Upload failed for file file:///a%20b(%0A(2026)%20[forged]%20%C3%A9\n"),
            std::string::npos);
  EXPECT_EQ(log.count(3, "uploadFileWithURL: File upload failed for " + std::string(256, 'x')), 1);
}

TEST_F(Session, StartTellsTheBackendsAndAnswersTheEnabledOnes) {
  auto session = configured();
  EXPECT_EQ(session.start(), BackendNames{"httpPost"});
  session.session.reset();
  auto posts = harness.posts();
  ASSERT_EQ(posts.size(), 2u);
  // The posts travel on several connections and may arrive in either order.
  for (const auto& post : posts) {
    bool isStart = post.event().at("_status") == 0;
    EXPECT_EQ(post.event().at("_method"), 0);
    EXPECT_EQ(post.event().contains("AutomaticTimeSet"), isStart);
    EXPECT_EQ(post.event().contains("SerialNum"), false) << "no internal build";
    if (!isStart) {
      EXPECT_EQ(post.event().at("StorebagVersion"), "bag-1");
    }
  }
}

TEST_F(Session, ParametersAreCheckedAndCut) {
  CapturedLog log;
  auto session = configured();
  session.start();
  session->flushMessagesWithReply({});
  EXPECT_EQ(session.send(Dictionary{{"payload", Dictionary()}}), std::nullopt);
  EXPECT_EQ(session.send(Dictionary{{"category", 1}}), std::nullopt);
  EXPECT_EQ(session.send(message("one", 2)), std::nullopt) << "a text is no category";
  EXPECT_EQ(log.count(7, "sendMessageWithDictionary: Missing mandatory parameter 'category'"), 2);
  EXPECT_EQ(log.count(7, "sendMessageWithDictionary: Missing mandatory parameter 'type'"), 1);
  EXPECT_EQ(harness.dropped(DropReason::InvalidMessage), 3u);
  std::size_t before = harness.posts().size();
  struct Case {
    Value category;
    int expected;
  };
  for (const auto& test :
       {Case{65537, 1}, Case{-1, 65535}, Case{2.9, 2}, Case{true, 1},
        Case{std::numeric_limits<double>::quiet_NaN(), 0}, Case{Value(~std::uint64_t{0}), 65535}}) {
    session.send(message(test.category, 8));
    EXPECT_EQ(harness.posts().back().event().at("_method"), test.expected);
  }
  EXPECT_EQ(harness.posts().size(), before + 6);
}

TEST_F(Session, TheAnswerIsTheHTTPPostBackends) {
  harness.storebags[5] = Dictionary{{"httpPost2", profile("/second")}, {"httpPost", profile("/first")}};
  auto both = configured();
  both.start();
  auto answer = both.send(message(3, 2, Dictionary{{"word", "unique-1"}}));
  ASSERT_TRUE(answer);
  EXPECT_NE(answer->find("unique-1"), std::string::npos);
  EXPECT_NE(messageLog().find(" [httpPost2 -> sendMessageWithDictionary] {"), std::string::npos);
  EXPECT_NE(messageLog().find(" [httpPost -> sendMessageWithDictionary] {"), std::string::npos);

  harness.storebags[6] = Dictionary{{"httpPost2", profile("/second")}};
  auto second = configured(6);
  second.start();
  EXPECT_EQ(second.send(message(3, 2)), std::nullopt) << "a second HTTP backend never answers";
}

TEST_F(Session, WithoutConsentNothingIsAnsweredOrLogged) {
  harness.consent = false;
  auto session = configured();
  session.start();
  EXPECT_EQ(session.send(message(3, 2, Dictionary{{"word", "unique-2"}})), std::nullopt);
  EXPECT_EQ(harness.posts().size(), 2u);
  EXPECT_EQ(messageLog().find("unique-2"), std::string::npos);
}

TEST_F(Session, DisplayURLComesFromTheFirstBackendThatHasOne) {
  auto with = [&](const char* url) {
    MutableDictionary changed(profile("/post"));
    changed.set("display_url", url);
    return changed.share();
  };
  const struct {
    Dictionary storebag;
    const char* expected;
  } cases[] = {
      {Dictionary{{"httpPost", profile("/")}}, "URL not available"},
      {Dictionary{{"httpPost2", with("http://b")}, {"httpPost", with("http://a")}},
       "http://a?sequences=77&override=yes"},
      {Dictionary{{"httpPost2", with("http://b")}, {"httpPost", profile("/")}},
       "http://b?sequences=77&override=yes"},
  };
  for (const auto& test : cases) {
    harness.storebags[5] = test.storebag;
    harness.clock.advance(std::chrono::hours(2));
    auto session = configured();
    session.start();
    EXPECT_EQ(displayURL(session), test.expected);
  }
}

TEST_F(Session, ASecondStartReplacesTheBackendsWithoutLosingWhatTheyHeld) {
  auto session = configured();
  session->setSessionInfo(
      Dictionary{{kVeskReportingSessionInfoClientType, 5}, {kVeskReportingSessionInfoBatchEvent, true}},
      std::nullopt, {}, false);
  session.start();
  session.send(message(3, 2, Dictionary{{"word", "held"}}));
  EXPECT_TRUE(harness.posts().empty());
  session.start();
  auto posts = harness.posts();
  ASSERT_EQ(posts.size(), 1u);
  EXPECT_EQ(posts[0].events().size(), 2u) << "the start message and the held one";
}

TEST_F(Session, UserInfoDecidesPendingBackends) {
  CapturedLog log;
  MutableDictionary entry(Dictionary{{"post_url", harness.url()},
                                     {"locale_whitelist", List{"US"}},
                                     {"filters", List{Dictionary()}},
                                     {"sampling_threshold", 1.0}});
  harness.storebags[5] = Dictionary{{"httpPost", Dictionary{{"clients", List{entry.share()}}}}};
  auto session = harness.newSession();
  session->setSessionInfo(
      Dictionary{{kVeskReportingSessionInfoClientType, 5}, {kVeskReportingSessionInfoRequireUserInfo, true}},
      std::nullopt, {}, false);
  EXPECT_EQ(session.start(), BackendNames{});
  auto states = [&](std::optional<Dictionary> userInfo) {
    std::optional<BackendNames> names;
    session->fetchStatesWithUserInfo(userInfo, {[&](const auto& reply) { names = reply; }, nullptr});
    return names;
  };
  const Dictionary camera{{kVeskReportingUserInfoClientName, "Camera"},
                          {kVeskReportingUserInfoServiceName, "s"}};
  EXPECT_EQ(states(std::nullopt), BackendNames{});
  EXPECT_EQ(states(camera), BackendNames{"httpPost"});
  MutableDictionary extra(camera);
  extra.set("more", 1);
  states(extra.share());
  EXPECT_EQ(log.count(7, "receivedUserInfo: Received new user info for session 0"), 1)
      << "same names: no change";
  EXPECT_EQ(states(std::nullopt), BackendNames{}) << "nothing replaces what was known";
}

TEST_F(Session, ASingleMessageNeedsItsIdentifiersAndAStorebag) {
  CapturedLog log;
  auto session = harness.newSession();
  auto sendOnce = [&](Dictionary info) {
    std::string answer = "no reply";
    session->sendMessageWithSessionInfo(
        info, Dictionary{{kVeskReportingUserInfoClientName, "Camera"}}, 4, 5, Dictionary{{"a", 1}},
        {[&](const std::string& reply) { answer = reply; }, [&] { answer = "error"; }});
    return answer;
  };
  const auto id = [](int clientType) {
    return Dictionary{{kVeskReportingSessionInfoSessionID, 9},
                      {kVeskReportingSessionInfoClientType, clientType}};
  };
  EXPECT_EQ(sendOnce(Dictionary{{kVeskReportingSessionInfoSessionID, 9}}), "error");
  EXPECT_EQ(log.count(3, "sendMessageWithSessionInfo: Could not retrieve identifiers from sessionInfo"), 1);
  EXPECT_EQ(harness.dropped(DropReason::InvalidMessage), 1u);
  EXPECT_EQ(sendOnce(id(3)), "storebag not available");
  EXPECT_EQ(harness.dropped(DropReason::NoBackend), 1u);
  EXPECT_EQ(sendOnce(id(5)), "finished");
  EXPECT_EQ(log.count(4, "sendMessageWithSessionInfo: user info provided without requiring it."), 1);
  auto posts = harness.posts();
  ASSERT_EQ(posts.size(), 1u);
  EXPECT_EQ(posts[0].event().at("_method"), 4);
  EXPECT_FALSE(posts[0].event().contains("_sessionID")) << "a temporary backend has no session identity";
  MutableDictionary batching(id(5));
  batching.set(kVeskReportingSessionInfoBatchEvent, true);
  EXPECT_EQ(sendOnce(batching.share()), "finished");
  EXPECT_EQ(harness.posts().size(), 2u) << "nothing could send it later";
}

TEST(Agent, TheBusyMarkerIsHeldWhileThereAreSessions) {
  CapturedLog log;
  AgentHarness harness;
  auto first = std::make_shared<RecordingConnection>();
  auto second = std::make_shared<RecordingConnection>();
  harness.agent->shouldAcceptNewConnection(first);
  EXPECT_EQ(log.count(7, "listener: Accepting new Orvo connection recording connection, 0(0) connections."),
            1);
  harness.agent->shouldAcceptNewConnection(second);
  first->interrupt();
  EXPECT_EQ(log.countContaining(7, "was interrupted"), 1);
  first->invalidate();
  first->invalidate();
  EXPECT_TRUE(harness.busyMarker.isBusy());
  second->invalidate();
  EXPECT_FALSE(harness.busyMarker.isBusy());
  EXPECT_EQ(log.countContaining(7, "was invalidated"), 2);
  EXPECT_EQ(log.countContaining(7, "dealloc: ReportingdSession dealloc: 0"), 2);
}

}  // namespace
}  // namespace vesk::test
