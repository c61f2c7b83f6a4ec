// The whole road on real processes: client library, daemon in its sandbox, signed storebag, TLS collector.
#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <set>
#include <thread>

#include "tests/support/DaemonHarness.h"

namespace vesk::test {
namespace {

Dictionary message(int category, Dictionary payload, int flag = 0) {
  return Dictionary{{"category", category}, {"type", 2}, {"flag", flag}, {"payload", std::move(payload)}};
}

bool queued(ReportingStatus status) { return status == ReportingStatus::Queued; }

TEST(Road, MessagesArriveFilteredSampledAndSigned) {
  DaemonHarness harness;
  harness.writeStorebag("zelko", R"(
version = "2024.2"
[[release.httpPost.clients]]
client = "Camera"
locale_whitelist = ["US"]
sampling_threshold = 1.0
expedite = 0
post_url = "@EVENTS@"
realtime_post_url = "@EVENTS@/now"
[[release.httpPost.clients.filters]]
key = "secret"
action = "remove"
[[release.httpPost.clients.filters]]
key = "USERNAME"
action = "sha256"
)");
  harness.startDaemon();
  const Dictionary user{{kVeskReportingUserInfoClientName, "Camera"},
                        {kVeskReportingUserInfoServiceName, "Clips"}};
  {
    RoadClient client(harness, Dictionary{{kVeskReportingSessionInfoRequireUserInfo, true}}, user);
    EXPECT_EQ(client.enabled, BackendNames{"httpPost"});
    ASSERT_TRUE(queued(client.reporting.sendMessage(
        message(3, Dictionary{{"username", "Ann"}, {"secret", "x"}, {"frames", 240}, {"ratio", 0.5}}))));
    ASSERT_TRUE(queued(client.reporting.sendMessage(message(4, Dictionary{{"when", Date{12.5}}}, 1))));
    auto now = harness.waitForEventsOfMethod(4, 1).at(0);
    EXPECT_TRUE(std::string(now.at("path").as_string()).ends_with("/now"))
        << "realtime does not wait for the batch";
    EXPECT_EQ(now.at("event").at("when"), 12.5);
    EXPECT_EQ(now.at("headers").at("X-Vesk-Event-Map"), "4 2");
    auto flushed = client.reporting.flushMessagesAndWait();
    ASSERT_TRUE(flushed) << flushed.detail;
    ASSERT_TRUE(flushed.answer);
    EXPECT_NE(flushed.answer->find("\"frames\": 240"), std::string::npos);
  }
  auto held = harness.waitForEventsOfMethod(3, 1).at(0);
  const auto& event = held.at("event").as_object();
  EXPECT_EQ(event.at("username"), "17239b6e250110330eda64a29c610bf146f89883371fab093feda03bec61b646")
      << "the digest of Ann";
  EXPECT_FALSE(event.contains("secret"));
  EXPECT_EQ(event.at("frames"), 240);
  EXPECT_EQ(event.at("_sender"), "HD");
  EXPECT_EQ(event.at("clientName"), "Camera");
  EXPECT_EQ(held.at("headers").at("X-Vesk-Client-Name"), "Camera");
  EXPECT_EQ(held.at("headers").at("X-Vesk-Sender"), "HD");
  // The start message and the end of the session frame the client's own.
  auto internal = harness.waitForEventsOfMethod(0, 2);
  EXPECT_TRUE(std::any_of(internal.begin(), internal.end(), [](const auto& post) {
    auto version = post.at("event").as_object().if_contains("StorebagVersion");
    return version && *version == "2024.2";
  })) << "posts of different times may overtake each other";
  EXPECT_NE(harness.messageLog().find("[httpPost -> flushMessages]"), std::string::npos);
  EXPECT_EQ(harness.stopDaemon(), 0);
}

TEST(Road, StorebagsAreCachedForTheirAgeAndThenRevalidated) {
  DaemonHarness harness({"--max-age", "0"});
  harness.writeStorebag("brannic", "version = \"1\"\n[[release.httpPost.clients]]\n");
  harness.startDaemon();
  for (int i = 0; i < 3; ++i) RoadClient client(harness);
  EXPECT_EQ(harness.collectorCount("storebagsSent"), 1) << "the storebag itself says an hour";
  for (int i = 0; i < 3; ++i) {
    RoadClient client(harness, Dictionary{{kVeskReportingSessionInfoClientType, 6}});
    EXPECT_EQ(client.enabled, BackendNames{"httpPost"});
  }
  EXPECT_EQ(harness.collectorCount("storebagsSent"), 2);
  EXPECT_EQ(harness.collectorCount("storebagsUnchanged"), 2) << "no age: asked each time, sent once";
}

struct EnvironmentCase {
  int type;
  const char* backend;  // what its section enables; null: no storebag
};

TEST(Road, TheEnvironmentChoosesTheSection) {
  for (const auto& test :
       {EnvironmentCase{1, "httpPost"}, EnvironmentCase{2, "httpPost2"}, EnvironmentCase{3, "httpPost"},
        EnvironmentCase{0, nullptr}, EnvironmentCase{9, "httpPost2"}}) {
    SCOPED_TRACE(test.type);
    DaemonHarness harness;
    harness.writeStorebag("zelko", R"(
version = "1"
[[development.httpPost.clients]]
[[corvane_internal.httpPost2.clients]]
[[release.httpPost.clients]]
)");
    harness.setPreference("environmentType", std::to_string(test.type));
    harness.startDaemon();
    RoadClient client(harness);
    auto expected = test.backend ? BackendNamesAnswer(BackendNames{test.backend}) : std::nullopt;
    EXPECT_EQ(client.enabled, expected);
    if (test.type == 3) {
      EXPECT_TRUE(harness.daemon().waitForText("Seed section is missing in the storebag."));
    }
  }
}

TEST(Road, ABadSignatureGivesNoStorebagAndIsNotFetchedAgainAtOnce) {
  DaemonHarness harness;
  harness.setFault("storebag=bad-signature");
  harness.startDaemon();
  RoadClient first(harness);
  EXPECT_EQ(first.enabled, std::nullopt);
  EXPECT_TRUE(harness.daemon().waitForText("fetchStorebagWithName: Signature can not be verified, "));
  harness.setFault("storebag=none");
  RoadClient second(harness);
  EXPECT_EQ(second.enabled, std::nullopt);
  EXPECT_TRUE(harness.daemon().waitForText("must wait 900 seconds between attempts"));
}

TEST(Road, WithoutItsServerPalvoFallsBack) {
  DaemonHarness harness;
  harness.startDaemon();
  harness.stopCollector();
  RoadClient palvo(harness, Dictionary{{kVeskReportingSessionInfoClientType, 7}});
  EXPECT_TRUE(palvo.enabled);
  EXPECT_TRUE(harness.daemon().waitForText("fetchStorebagWithName: Loading default storebag 'palvo'"));
  RoadClient zelko(harness);
  EXPECT_EQ(zelko.enabled, std::nullopt);
}

TEST(Road, AServerErrorSwitchesTheBackendOff) {
  DaemonHarness harness;
  harness.startDaemon();
  RoadClient client(harness);
  harness.setFault("post=503*1");
  ASSERT_TRUE(queued(client.reporting.sendMessage(message(3, {}, 1))));
  ASSERT_TRUE(
      harness.daemon().waitForText("postJSONMessage: backend httpPost disabled by server 503 return code"));
  ASSERT_TRUE(queued(client.reporting.sendMessage(message(4, {}, 1))));
  // The line is written a moment before the state changes, on another thread.
  BackendNamesAnswer enabled;
  for (int tries = 0; tries < 1000 && enabled != BackendNames{}; ++tries) {
    auto states = client.reporting.fetchStates(std::nullopt);
    ASSERT_TRUE(states) << states.detail;
    enabled = states.answer;
  }
  EXPECT_EQ(enabled, BackendNames{}) << "nothing happened that would decide the state anew";
}

TEST(Road, NothingIsLostWhileTheCollectorIsAway) {
  DaemonHarness harness;
  harness.startDaemon();
  constexpr int kMessages = 60;
  {
    RoadClient client(harness);
    ASSERT_TRUE(client.reporting.flushMessagesAndWait());
    harness.waitForEventsOfMethod(0, 1);
    harness.stopCollector();
    for (int i = 0; i < kMessages; ++i) {
      ASSERT_TRUE(queued(client.reporting.sendMessage(message(3, Dictionary{{"n", i}}))));
    }
    auto handedOver = client.reporting.sendMessageAndWait(message(5, {}));
    ASSERT_TRUE(handedOver) << handedOver.detail;
  }
  // An outage as operators know it; only its length can show that the daemon waits it out.
  std::this_thread::sleep_for(std::chrono::seconds(20));
  harness.startCollector();
  auto arrived = harness.waitForEventsOfMethod(3, kMessages);
  std::set<std::int64_t> numbers;
  for (const auto& line : arrived) numbers.insert(line.at("event").at("n").as_int64());
  EXPECT_EQ(numbers.size(), kMessages) << "each of them";
  harness.waitForEventsOfMethod(5, 1);
}

TEST(Road, AClientThatDiesDoesNotDisturbAnother) {
  DaemonHarness harness;
  harness.startDaemon();
  RoadClient stays(harness);
  auto dying = std::make_unique<ChildProcess>(std::vector<std::string>{
      "python3", "-c",
      "import socket,sys,time\n"
      "s=socket.socket(socket.AF_UNIX); s.connect(sys.argv[1])\n"
      "s.sendall(b'\\0AUTH EXTERNAL\\r\\nDATA\\r\\nNEGOTIATE_UNIX_FD\\r\\nBEGIN\\r\\n')\n"
      "s.sendall(b'l\\1\\0\\1\\xff\\0\\0\\0\\1\\0\\0\\0')\n"  // three quarters of a message's first header
      "print('sent', flush=True); time.sleep(600)\n",
      harness.socketPath()});
  ASSERT_TRUE(dying->waitForText("sent"));
  for (int i = 0; i < 50; ++i) {
    ASSERT_TRUE(queued(stays.reporting.sendMessage(message(3, Dictionary{{"n", i}}))));
    if (i == 25) dying.reset();
  }
  EXPECT_EQ(harness.waitForEventsOfMethod(3, 50).size(), 50u);
  EXPECT_TRUE(stays.reporting.isConnected());
}

TEST(Road, ClientsWorkInParallel) {
  DaemonHarness harness;
  harness.startDaemon();
  constexpr int kClients = 4;
  constexpr int kEach = 200;
  std::vector<std::thread> threads;
  for (int c = 0; c < kClients; ++c) {
    threads.emplace_back([&, c] {
      RoadClient client(harness, Dictionary{{kVeskReportingSessionInfoBatchEvent, true}});
      for (int i = 0; i < kEach; ++i) {
        EXPECT_TRUE(queued(client.reporting.sendMessage(message(3, Dictionary{{"id", c * kEach + i}}))));
      }
    });
  }
  for (auto& thread : threads) thread.join();
  std::set<std::int64_t> ids;
  for (const auto& line : harness.waitForEventsOfMethod(3, kClients * kEach)) {
    ids.insert(line.at("event").at("id").as_int64());
  }
  EXPECT_EQ(ids.size(), kClients * kEach) << "every message once";
}

TEST(Road, TerminationSendsWhatIsHeld) {
  DaemonHarness harness;
  harness.startDaemon();
  RoadClient client(harness, Dictionary{{kVeskReportingSessionInfoBatchEvent, true}});
  auto handedOver = client.reporting.sendMessageAndWait(message(3, Dictionary{{"held", true}}));
  ASSERT_TRUE(handedOver) << handedOver.detail;
  EXPECT_EQ(harness.stopDaemon(), 0);
  harness.waitForEventsOfMethod(3, 1);
  EXPECT_EQ(harness.waitForEventsOfMethod(0, 2).size(), 2u) << "start and end of the session";
}

TEST(Road, AStalledCollectorDoesNotHoldUpTheEndForEver) {
  DaemonHarness harness;
  harness.startDaemon();
  RoadClient client(harness);
  harness.setFault("post=stall");
  auto handedOver = client.reporting.sendMessageAndWait(message(3, {}, 1));
  ASSERT_TRUE(handedOver) << handedOver.detail;
  EXPECT_EQ(harness.stopDaemon(), 0);
  EXPECT_TRUE(
      harness.daemon().waitForText("main: Stopping although posts are still outstanding after 10 seconds."));
}

TEST(Road, TheSandboxHolds) {
  DaemonHarness harness;
  // A preferences file that leads out of the sandbox: the daemon is root here, and still can't read it.
  std::filesystem::create_directories(harness.root / "etc/veskreporting/preferences");
  std::filesystem::create_symlink("/etc/shadow",
                                  harness.root / "etc/veskreporting/preferences/com.corvane.timed.toml");
  harness.startDaemon();
  RoadClient client(harness);
  EXPECT_TRUE(harness.daemon().waitForText("com.corvane.timed.toml"));
  std::ifstream status("/proc/" + std::to_string(harness.daemon().pid()) + "/status");
  std::string text{std::istreambuf_iterator<char>(status), {}};
  EXPECT_NE(text.find("NoNewPrivs:\t1"), std::string::npos);
  EXPECT_NE(text.find("Seccomp:\t2"), std::string::npos);
}

TEST(Road, WithoutItsProfileTheDaemonDoesNotStart) {
  TempDirectory root;
  ChildProcess daemon({VESK_BIN_DIRECTORY "/veskreportingd", "--root", root.path().string()});
  EXPECT_EQ(daemon.wait(), 255);
  EXPECT_NE(daemon.errors().find("main: confine_enter() fails: "), std::string::npos);
  EXPECT_FALSE(std::filesystem::exists(root / "run"));
}

}  // namespace
}  // namespace vesk::test
