// Sessions driven directly: configuration, start, user info, single messages, and their end.
#include <gtest/gtest.h>

#include "daemon/Diagnostics.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/SessionHarness.h"

namespace vesk::test {
namespace {

TEST_F(Session, WhatAClientCallsItsFileFillsNoLog) {
  CapturedLog log;
  auto session = configured(identified(4));
  const std::string written = logged([&] {
    for (const std::string& url : {std::string("file:///a%20b(\n(2026) [forged] \xc3\xa9"),
                                   "file://host" + std::string(1 << 20, '\n'), std::string(1 << 20, 'x')})
      session->uploadFileAtPath(url, "", {[](const bool& reply) { EXPECT_FALSE(reply); }, nullptr});
  });
  EXPECT_EQ(std::count(written.begin(), written.end(), '\n'), 3);
  EXPECT_LT(written.size(), 2000u);
  EXPECT_TRUE(contains(written, "Upload failed for file file:///a%20b(%0A(2026)%20[forged]%20%C3%A9\n"));
  EXPECT_EQ(log.count(3, "uploadFileWithURL: File upload failed for " + std::string(256, 'x')), 1);
  EXPECT_EQ(harness.dropped(DropReason::UploadFailed), 3u);
}

TEST_F(Session, PausesItsConnectionWhileTooMuchOfItWaitsForAServerThatAnswers) {
  harness.services.postBudget = std::make_shared<PostBudget>(PostBudget::Limits{20'000, 30'000});
  auto session = started(storebag("httpPost"));
  EXPECT_FALSE(session.connection->isPaused);
  for (int i = 0; i < 1000 && !session.connection->isPaused; ++i) session.send(message(4, 5));
  EXPECT_TRUE(session.connection->isPaused);
  harness.posts();
  EXPECT_FALSE(session.connection->isPaused);
}

TEST_F(Session, OperatorsSeeTheirOwnOrAll) {
  const auto connection = std::make_shared<RecordingConnection>();
  harness.agent->shouldAcceptNewConnection(connection);
  harness.agent->sessions().front()->setSessionInfo(identified(5), std::nullopt, {}, false);
  const CounterHistory history("", harness.services.counters);
  const Diagnostics diagnostics(
      {*harness.agent, harness.services, nullptr, {}, [] { return PublicKeys{"k"}; }, history});
  const auto seen = [&](uid_t user) { return diagnostics.status({user}).find("sessions")->list()->size(); };
  EXPECT_EQ(seen(0), 1u);
  EXPECT_EQ(seen(static_cast<uid_t>(-1)), 1u) << "the session's own user";
  EXPECT_EQ(seen(12345), 0u);
  connection->invalidate();
}

TEST_F(Session, BackendsAreStampedWithTheDeviceAndTheClient) {
  writeFacts(
      "DeviceName = \"Phone\"\nProductType = \"Phone7,2\"\nProductVersion = \"12.4\"\nBuildVersion = "
      "\"16G77\"\n"
      "UniqueDeviceID = \"0123456789abcdef0123456789abcdef01234567\"\n");
  harness.sessionServices.libraryVersion = "300.260.5";
  harness.clock.set(1'700'000'050.25);
  harness.storebags[5] = storebag("httpPost dashboard");
  const Dictionary info =
      merged(identified(5, 4'000'000'001), Dictionary{{kVeskReportingSessionInfoClientVersion, 70'000}});
  for (const bool single : {false, true}) {
    auto session = configured(info, kCamera);
    const std::string lines = logged([&] {
      if (single) {
        EXPECT_EQ(sendOnce(session, info, kCamera), "finished");
      } else {
        EXPECT_EQ(session.start(), (BackendNames{"httpPost", "dashboard"}));
        harness.posts();
        session.send(message(4, 5, Dictionary{{"a", 1}}));
      }
    });
    const std::string line =
        std::string("[dashboard -> sendMessageWith") + (single ? "SessionInfo" : "Dictionary") +
        "] 1700000050.248 0123456789abcdef0123456789abcdef01234567 127.0.0.1 HD  4464 4000000001 ";
    EXPECT_TRUE(contains(lines, line + (single ? "    1     4     5  a=1\n" : "    2     4     5  a=1\n")))
        << lines;
    const auto event = lastEvent();
    const boost::json::object fields = boost::json::parse(R"({"_startTS": 1700000040, "_clientVersion": 4464,
        "_productFamily": "Phone", "_productModel": "Phone7,2", "_osVersion": "12.4", "_build": "16G77",
        "_reportVers": "44.4", "_sender": "HD", "clientName": "Camera", "_method": 4, "_status": 5})")
                                           .as_object();
    for (const auto& [key, value] : fields) EXPECT_EQ(event.at(key), value) << key;
    const auto* identity = event.if_contains("_sessionID");
    EXPECT_EQ(identity ? std::string(identity->as_string()) : "", single ? "" : session->sessionIDString())
        << "its own, before there is a family; a temporary backend has none";
  }
}

TEST_F(Session, AStorebagNamesTheBackends) {
  harness.storebags[7] = storebag("wren nonsense httpPost");
  for (const char* product : {"Phone7,2", "Bramble"}) {
    CapturedLog log;
    writeFacts("DeviceName = \"Phone\"\nProductType = \"" + std::string(product) + "\"\n");
    const bool hasAdaptors = std::string_view(product) != "Bramble";
    auto session = configured(identified(7));
    EXPECT_EQ(session.start(), hasAdaptors ? BackendNames({"wren", "httpPost"}) : BackendNames{"httpPost"});
    EXPECT_EQ(log.count(3, "VeskReportingBackend(newBackendWithName): wren"), hasAdaptors ? 0 : 1);
    EXPECT_EQ(log.count(3, "VeskReportingBackend(newBackendWithName): nonsense"), 1);
  }
}

TEST_F(Session, StartAndEndAreTold) {
  const std::pair<std::string, bool> settings[] = {
      {"", true}, {" = false", false}, {" = 0", false}, {" = 1", true}};
  for (const auto& [setting, isAutomatic] : settings) {
    testRoot().write("etc/veskreporting/preferences/com.corvane.timed.toml",
                     setting.empty() ? "" : "TMAutomaticTimeZoneEnabled" + setting);
    EXPECT_EQ(deviceDictionary("7.3", "US"), (Dictionary{{"AutomaticTimeSet", isAutomatic}})) << setting;
    auto session = configured();
    EXPECT_EQ(session.start(), BackendNames{"httpPost"});
    EXPECT_EQ(session->storebagVersion(), "bag-1");
    const std::size_t before = harness.posts().size();
    session.session.reset();
    const auto posts = harness.posts();
    ASSERT_EQ(posts.size(), before + 2);
    // They are sent on two connections and may arrive in either order.
    const bool inOrder = posts[before].event().at("_status") == 0;
    const auto start = posts[before + !inOrder].event(), end = posts[before + inOrder].event();
    EXPECT_EQ(start.at("AutomaticTimeSet"), isAutomatic);
    EXPECT_EQ(end.at("_status"), 1);
    EXPECT_EQ(end.at("StorebagVersion"), "bag-1");
    for (const auto& event : {start, end}) EXPECT_EQ(event.at("_method"), 0);
  }
}

TEST_F(Session, ASecondStartReplacesTheBackendsWithoutLosingWhatTheyHeld) {
  auto session = configured(Dictionary{{kVeskReportingSessionInfoBatchEvent, true}});
  session.start();
  session.send(message(3, 2, Dictionary{{"word", "held"}}));
  EXPECT_TRUE(harness.posts().empty());
  const std::string lines = logged([&] { session.start(); });
  auto posts = harness.posts();
  ASSERT_EQ(posts.size(), 1u);
  EXPECT_EQ(posts[0].events().size(), 2u) << "the start message and the held one";
  EXPECT_TRUE(contains(lines, ") [httpPost -> flushMessages] {")) << lines;
  EXPECT_TRUE(contains(lines, "\"word\": \"held\""));
}

TEST_F(Session, UserInfoDecidesPendingBackends) {
  const Dictionary entry{{"post_url", harness.url()},
                         {"locale_whitelist", List{"US"}},
                         {"filters", List{Dictionary()}},
                         {"sampling_threshold", 1.0}};
  harness.storebags[5] = Dictionary{{"httpPost", Dictionary{{"clients", List{entry}}}}};
  auto session = configured(Dictionary{{kVeskReportingSessionInfoRequireUserInfo, true}});
  EXPECT_EQ(session.start(), BackendNames{});
  const Dictionary otherService = merged(kCamera, Dictionary{{kVeskReportingUserInfoServiceName, "Other"}});
  const Dictionary otherClient = merged(kCamera, Dictionary{{kVeskReportingUserInfoClientName, "Other"}});
  const Dictionary nameless{{kVeskReportingUserInfoServiceName, "Clips"}};
  const Dictionary more = merged(kCamera, Dictionary{{"more", 1}});
  const std::pair<std::optional<Dictionary>, bool> rows[] = {
      {std::nullopt, false}, {kCamera, true},      {more, false},
      {otherService, true},  {otherClient, true},  {nameless, true},
      {nameless, true},      {std::nullopt, true}, {more, true}};
  std::optional<Dictionary> kept;
  for (const auto& [given, isNews] : rows) {
    CapturedLog log;
    const std::string what = given ? describe(*given) : "none";
    if (isNews) kept = given;
    EXPECT_EQ(session.states(given), kept ? BackendNames{"httpPost"} : BackendNames{}) << what;
    EXPECT_EQ(log.count(7, "receivedUserInfo: Received new user info for session 77"), isNews) << what;
    EXPECT_EQ(session->userInfo(), kept) << what;
    harness.posts();
    if (!session.send(message(3, 2))) continue;
    const auto event = lastEvent();
    for (const char* key : {kVeskReportingUserInfoClientName, kVeskReportingUserInfoServiceName, "more"})
      EXPECT_EQ(event.contains(key), kept->contains(key)) << what << key;
  }
}

TEST_F(Session, ASingleMessageNeedsItsIdentifiersAndAStorebag) {
  CapturedLog log;
  auto session = configured();
  const Dictionary before = session->sessionInfo().value();
  const Dictionary noID{{kVeskReportingSessionInfoClientType, 5}};
  const Dictionary noType{{kVeskReportingSessionInfoSessionID, 9}};
  const Dictionary refused[] = {
      noID, noType, identified("5", 9), identified(5, "9"), identified(nullptr, 9), identified(5, nullptr)};
  for (const auto& info : refused) {
    EXPECT_EQ(sendOnce(session, info, kCamera), "no answer") << describe(info);
    EXPECT_EQ(session->sessionID(), 77u);
    EXPECT_EQ(session->sessionInfo(), before);
    EXPECT_EQ(session->userInfo(), std::nullopt);
  }
  EXPECT_EQ(log.count(3, "sendMessageWithSessionInfo: Could not retrieve identifiers from sessionInfo"), 6);
  EXPECT_EQ(harness.dropped(DropReason::InvalidMessage), 6u);
  EXPECT_EQ(sendOnce(session, identified(3, 8)), "storebag not available");
  EXPECT_EQ(session->sessionID(), 8u) << "taken all the same";
  EXPECT_EQ(harness.dropped(DropReason::NoBackend), 1u);
  EXPECT_TRUE(harness.posts().empty());

  const Dictionary batching =
      merged(identified(5, 9), Dictionary{{kVeskReportingSessionInfoBatchEvent, true}});
  const std::string lines = logged([&] { EXPECT_EQ(sendOnce(session, batching, kCamera), "finished"); });
  EXPECT_EQ(session->sessionID(), 9u);
  EXPECT_EQ(session->sessionInfo(), batching);
  EXPECT_EQ(session->userInfo(), kCamera);
  EXPECT_EQ(harness.posts().size(), 1u) << "nothing could send it later";
  EXPECT_TRUE(contains(lines, ") [httpPost -> flushMessages] {")) << lines;
  EXPECT_FALSE(contains(lines, "sendMessageWithSessionInfo")) << "held, since its flag is 0";
  EXPECT_EQ(session->fetchReportingStates(), std::nullopt) << "its backends are gone";
}

TEST_F(Session, AggregationFollowsTheLastConfigurationAndTheEndComesInOrder) {
  auto session = configured(Dictionary{{kVeskReportingSessionInfoBatchEvent, true}});
  session.start();
  const Dictionary info = session->sessionInfo().value();
  for (const bool wanted : {true, false, true}) {
    session->setSessionInfo(info, std::nullopt, {}, wanted);
    EXPECT_EQ(session->hasAggregator(), wanted);
    session.send(message(3, 2, Dictionary{{"wanted", wanted}}));
  }
  std::vector<std::size_t> posts;
  session.connection->onCall = [&](const IPCOutgoingCall&) { posts.push_back(harness.posts().size()); };
  session.session.reset();
  EXPECT_EQ(
      session.connection->told(),
      (std::vector<std::string>{
          R"(77: 1700000000.000000 3/2 {"wanted": true})", R"(77: 1700000000.000000 3/2 {"wanted": true})",
          R"(77: 1700000000.000000 0/1 {"StorebagVersion": "bag-1"})", "closing: 0.000000 0/0"}));
  EXPECT_EQ(posts, (std::vector<std::size_t>{0, 1}))
      << "the flush is between the last message and the closing one";
  session.connection->onCall = nullptr;
}

}  // namespace
}  // namespace vesk::test
