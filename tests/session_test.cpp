// Sessions driven directly: configuration, dispatch, answers, and their end.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <sstream>

#include "daemon/Diagnostics.h"
#include "platform/ipc/ExtensionTokens.h"
#include "platform/unicode/UTF8.h"
#include "tests/support/AgentHarness.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/RecordingServer.h"
#include "tests/support/TestRoot.h"

namespace vesk::test {
namespace {

const Dictionary kCamera{{kVeskReportingUserInfoClientName, "Camera"},
                         {kVeskReportingUserInfoServiceName, "Clips"}};

bool contains(std::string_view text, std::string_view part) { return text.find(part) != text.npos; }

class Session : public ::testing::Test {
 protected:
  Session() {
    writeFacts("DeviceName = \"Phone\"\nProductType = \"Phone7,2\"\n");
    harness.storebags[5] = storebag("httpPost");
  }
  static void writeFacts(const std::string& facts) {
    testRoot().write("etc/veskreporting/device.toml", facts);
  }
  /// A section with the named backends. "+" adds a display URL (http:// and the name); "~" makes the backend
  /// hold its messages for a batch. A name may occur twice.
  Dictionary storebag(const std::string& backends) const {
    MutableDictionary section;
    std::istringstream words(backends);
    for (std::string name; words >> name;) {
      const std::string marks = name.substr(std::min(name.size(), name.find_first_of("+~")));
      name.resize(name.size() - marks.size());
      Dictionary entry{{"post_url", harness.url()}, {"ip", "127.0.0.1"}, {"port", 9}};
      if (contains(marks, "~")) entry = merged(entry, Dictionary{{"expedite", 0}});
      MutableDictionary profile(merged(entry, Dictionary{{"clients", List{entry}}}));
      if (contains(marks, "+")) profile.set("display_url", "http://" + name);
      section.append(Text(name), profile.share());
    }
    return section.share();
  }
  DrivenSession configured(const Dictionary& info = {},
                           const std::optional<Dictionary>& userInfo = std::nullopt) {
    auto session = harness.newSession();
    session->setSessionInfo(merged(identified(5), info), userInfo, {}, false);
    return session;
  }
  DrivenSession started(const Dictionary& section, const Dictionary& info = {}) {
    harness.storebags[5] = section;
    harness.clock.advance(std::chrono::hours(2));
    auto session = configured(info);
    session.start();
    harness.posts();
    return session;
  }
  static Dictionary identified(Value clientType, Value sessionID = 77) {
    return Dictionary{{kVeskReportingSessionInfoSessionID, sessionID},
                      {kVeskReportingSessionInfoClientType, clientType}};
  }
  static Dictionary message(Value category, Value type, Dictionary payload = {}) {
    return Dictionary{{"category", category}, {"type", type}, {"payload", payload}};
  }
  static std::string sendOnce(DrivenSession& session, const Dictionary& info,
                              const std::optional<Dictionary>& userInfo = std::nullopt) {
    std::string answer;
    session->sendMessageWithSessionInfo(
        info, userInfo, 4, 5, Dictionary{{"a", 1}},
        {[&](const std::string& reply) { answer = reply; }, [&] { answer = "no answer"; }});
    return answer;
  }
  boost::json::object lastEvent() { return harness.posts().back().event(); }
  /// What `act` adds to the message log.
  template <class Act>
  static std::string logged(Act act) {
    constexpr char kDirectory[] = "var/mobile/Library/Logs/Dunmore/Retired";
    std::filesystem::remove_all(testRoot() / kDirectory);
    act();
    return testRoot().readAll(kDirectory);
  }

  AgentHarness harness;
};

std::string displayURL(DrivenSession& session) {
  std::string url;
  session->fetchDisplayURL({[&](const std::string& reply) { url = reply; }, nullptr});
  return url;
}

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

TEST_F(Session, ParametersAreCheckedAndCut) {
  auto session = started(storebag("httpPost"));
  EXPECT_EQ(session.send(Dictionary{{"payload", Dictionary()}}), std::nullopt);
  EXPECT_EQ(session.send(Dictionary{{"category", 1}}), std::nullopt);
  EXPECT_EQ(session.send(message("one", 2)), std::nullopt) << "a text is no category";
  EXPECT_EQ(session.send(message(1, nullptr)), std::nullopt);
  EXPECT_EQ(harness.dropped(DropReason::InvalidMessage), 4u);
  constexpr double kNaN = std::numeric_limits<double>::quiet_NaN();
  const std::pair<Value, int> numbers[] = {{65537, 1}, {-1, 65535}, {2.9, 2}, {true, 1}, {kNaN, 0}};
  for (const auto& [number, expected] : numbers) {
    session.send(message(number, 8));
    EXPECT_EQ(lastEvent().at("_method"), expected);
    EXPECT_EQ(lastEvent().at("_status"), 8);
    session.send(message(8, number));
    EXPECT_EQ(lastEvent().at("_status"), expected);
  }
  EXPECT_EQ(harness.posts().size(), 1u + 10u);
  session->sendMessageWithCategory(6, 7, Dictionary{{"a", "b"}}, {});
  EXPECT_EQ(lastEvent().at("_method"), 6);
  EXPECT_EQ(lastEvent().at("_status"), 7);
  EXPECT_EQ(lastEvent().at("a"), "b");

  auto holding = started(storebag("httpPost~"));
  const std::pair<Value, bool> flags[] = {{0, false},   {1, true},        {2, false},           {3, true},
                                          {"1", false}, {nullptr, false}, {4'294'967'297, true}};
  for (const auto& [flag, isRealtime] : flags) {
    EXPECT_EQ(holding.send(merged(message(3, 2), Dictionary{{"flag", flag}})).has_value(), isRealtime)
        << describe(flag);
  }
  EXPECT_EQ(holding.send(message(3, 2)), std::nullopt);
}

TEST_F(Session, TheAnswerIsTheHTTPPostBackendsOrTheDashboards) {
  // sent: whose answer: P of httpPost, D of the dashboard
  // loggedBySend: whose answer is in the message log; 2: httpPost2
  // flushed, loggedByFlush: the same for a flush
  const std::tuple<const char*, std::string, std::string, std::string, std::string> rows[] = {
      {"httpPost dashboard", "P", "PD", "", ""},
      {"dashboard httpPost", "P", "PD", "", ""},
      {"httpPost~ dashboard", "D", "D", "P", "P"},
      {"dashboard httpPost~", "D", "D", "P", "P"},
      {"httpPost2", "", "2", "", ""},
      {"httpPost2 dashboard", "D", "2D", "", ""},
      {"dashboard httpPost2~", "D", "D", "", "2"},
      {"httpPost~ httpPost2", "", "2", "P", "P"},
      {"", "", "", "", ""}};
  auto whose = [](const std::optional<std::string>& answer) {
    return !answer ? "" : answer->starts_with("{") ? "P" : "D";
  };
  for (const auto& [backends, sent, loggedBySend, flushed, loggedByFlush] : rows) {
    SCOPED_TRACE(backends);
    auto session = started(storebag(backends));
    auto check = [&](const std::string& operation, const std::string& expected, const std::string& log,
                     auto act) {
      std::optional<std::string> answer;
      const std::string lines = logged([&] { answer = act(); });
      EXPECT_EQ(whose(answer), expected) << operation;
      std::string from;
      for (const char* name : {"Post", "Post2", "dashboard"})
        if (contains(lines, name + (" -> " + operation + "] ")))
          from += name == std::string("dashboard") ? 'D' : name == std::string("Post") ? 'P' : '2';
      EXPECT_EQ(from, log) << lines;
    };
    check("sendMessageWithDictionary", sent, loggedBySend, [&] { return session.send(message(3, 2)); });
    check("flushMessages", flushed, loggedByFlush, [&] { return session.flush(); });
  }
}

TEST_F(Session, AnAnswerIsCutToWhatFitsIntoAMessage) {
  auto session = started(storebag("httpPost~"));
  session.flush();
  auto answerTo = [&](const std::string& text) {
    session.send(message(3, 2, Dictionary{{"a", text}}));
    return session.flush().value();
  };
  const std::size_t rest = answerTo("").size();
  EXPECT_EQ(answerTo(std::string(kMaxAnswerBytes - rest, 'x')).size(), std::size_t{1} << 20);
  for (std::size_t shift = 0; shift < 4; ++shift) {
    std::string text(shift, 'x');
    while (text.size() <= kMaxAnswerBytes) text += "\xF0\x9F\x90\x8B";
    std::string answer;
    const std::string lines = logged([&] { answer = answerTo(text); });
    EXPECT_LE(answer.size(), kMaxAnswerBytes);
    EXPECT_GT(answer.size(), kMaxAnswerBytes - 4);
    EXPECT_TRUE(isValidUTF8(answer)) << shift;
    const std::string last = "\n[cut: this answer has " + std::to_string(rest + text.size()) + " bytes]";
    ASSERT_TRUE(answer.ends_with(last)) << answer.substr(answer.size() - 60);
    EXPECT_TRUE(contains(lines, answer.substr(0, answer.size() - last.size())));
    EXPECT_TRUE(contains(lines, text)) << "the message log has all of it";
  }
}

TEST_F(Session, DisplayURLComesFromTheFirstBackendThatHasOne) {
  const std::pair<const char*, const char*> cases[] = {
      {"httpPost", "URL not available"},
      {"uploadServer+", "URL not available"},
      {"dashboard+ httpPost2+ httpPost+", "http://httpPost?sequences=77&override=yes"},
      {"dashboard+ httpPost2+ httpPost", "http://httpPost2?sequences=77&override=yes"},
      {"httpPost httpPost2 dashboard+", "http://dashboard?sequences=77&override=yes"},
      {"dashboard", "URL not available"},
      {"", "URL not available"}};
  for (const auto& [backends, expected] : cases) {
    auto session = started(storebag(backends));
    EXPECT_EQ(displayURL(session), expected) << backends;
  }
  auto session = started(storebag("httpPost+"), identified(5, 3'000'000'000));
  EXPECT_EQ(displayURL(session), "http://httpPost?sequences=-1294967296&override=yes");
}

TEST_F(Session, UploadsAreOfferedToEveryBackend) {
  RecordingServer server([](const HTTPReceived&, std::size_t) { return HTTPAnswer::text(200, "success"); });
  CapturedLog log;
  std::optional<bool> uploaded;
  auto twice = [&](const char* name, bool first, bool second) {
    MutableDictionary section;
    for (const bool takes : {first, second}) {
      Dictionary profile{{"ip", "127.0.0.1"}, {"port", 9}};
      section.append(Text(name), takes ? merged(profile, Dictionary{{"post_url", server.url()}}) : profile);
    }
    return section.share();
  };
  {
    // The first backend takes the descriptor, so none is left for the second.
    auto session = started(twice("uploadServer", true, true));
    const std::string path = testRoot().write("a.log", "text").string();
    FileDescriptor file(::open(path.c_str(), O_RDONLY));
    const std::string token = ExtensionTokens::shared().add({1, ::getuid()}, std::move(file));
    const std::string lines = logged([&] {
      session->uploadFileAtPath("file://" + path, token,
                                {[&](const bool& reply) { uploaded = reply; }, nullptr});
    });
    EXPECT_EQ(uploaded, true);
    EXPECT_TRUE(contains(lines, ") [uploadFileWithURL] Upload succeeded for file file://" + path + "\n"));
    EXPECT_EQ(log.count(7, "UploadBackend(uploadFileAtPath): Uploading file " + path), 2);
    EXPECT_EQ(log.count(7, "uploadFileWithURL: File upload successful for " + path), 1);
  }
  for (const auto& [first, second] : {std::pair{true, true}, {true, false}, {false, true}, {false, false}}) {
    const std::size_t before = server.count();
    auto session = started(twice("dashboard", first, second));
    session->uploadLogData(
        {1}, {[&](const bool& reply, const auto& error) { uploaded = !error && reply; }, nullptr});
    EXPECT_EQ(uploaded, first || second);
    EXPECT_EQ(server.count() - before, std::size_t{first} + std::size_t{second}) << "each is asked";
  }
  EXPECT_EQ(log.count(7, "uploadLogData: Log data array upload successful"), 3);
  EXPECT_EQ(harness.dropped(DropReason::UploadFailed), 1u);
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
