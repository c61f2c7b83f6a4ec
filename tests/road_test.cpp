// The full pipeline with real processes: client, daemon in its sandbox, signed storebag, TLS collector.
#include <gtest/gtest.h>

#include <algorithm>
#include <set>

#include "tests/support/DaemonHarness.h"

namespace vesk::test {
namespace {

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
  // The session's start and end messages frame the client's own.
  auto internal = harness.waitForEventsOfMethod(0, 2);
  EXPECT_TRUE(std::any_of(internal.begin(), internal.end(), [](const auto& post) {
    auto version = post.at("event").as_object().if_contains("StorebagVersion");
    return version && *version == "2024.2";
  })) << "posts of different times may overtake each other";
  EXPECT_NE(harness.messageLog().find("[httpPost -> flushMessages]"), std::string::npos);
  EXPECT_EQ(harness.stopDaemon(), 0);
}

TEST(Road, AStalledCollectorDoesNotHoldUpTheEndForEver) {
  DaemonHarness harness;
  harness.startDaemon();
  RoadClient client(harness);
  harness.setFault("post=stall");
  auto handedOver = client.reporting.sendMessageAndWait(message(3, {}, 1));
  ASSERT_TRUE(handedOver) << handedOver.detail;
  EXPECT_EQ(harness.stopDaemon(), 0);
  EXPECT_TRUE(harness.daemon().waitForText(
      "<4> main: Stopping although posts are still outstanding after 10 seconds."));
}

constexpr char kDashboardBag[] = R"(
version = "1"
[release.dashboard]
ip = "127.0.0.1"
port = @UDPPORT@
post_url = "@LOGDATA@"
display_url = "http://dash"
)";

class DashboardRoad : public testing::Test {
 protected:
  void start(std::vector<std::string> collectorArguments = {}, const std::string& reliable = {}) {
    _harness = std::make_unique<DaemonHarness>(std::move(collectorArguments));
    _harness->writeStorebag("zelko",
                            kDashboardBag + (reliable.empty() ? "" : "reliable = " + reliable + "\n"));
    _harness->startDaemon();
  }
  std::set<std::int64_t> numbersIn(const std::vector<boost::json::object>& datagrams) {
    std::set<std::int64_t> numbers;
    for (const auto& datagram : datagrams) {
      const auto& payload = datagram.at("payload").as_object();
      if (payload.contains("n")) numbers.insert(std::stoll(std::string(payload.at("n").as_string())));
    }
    return numbers;
  }

  std::unique_ptr<DaemonHarness> _harness;
};

TEST_F(DashboardRoad, AMessageBecomesADatagramALineAndAnAnswer) {
  start();
  {
    RoadClient client(*_harness);
    EXPECT_EQ(client.enabled, BackendNames{"dashboard"});
    EXPECT_EQ(client.reporting.fetchDisplayURL().answer, "http://dash?sequences=77&override=yes");
    auto sent = client.reporting.sendMessageAndWait(3, 2, Dictionary{{"text", "a=b\\c"}, {"n", 1}});
    ASSERT_TRUE(sent) << sent.detail;
    ASSERT_TRUE(sent.answer);
    EXPECT_TRUE(sent.answer->ends_with(" 127.0.0.1 HD     3    77     2     3     2  n=1 text=a\\=b\\\\c"))
        << *sent.answer;
    EXPECT_NE(_harness->messageLog().find("[dashboard -> sendMessageWithDictionary] " + *sent.answer),
              std::string::npos);
    auto uploaded = client.reporting.uploadLogData(List{"log", Date{1}});
    ASSERT_TRUE(uploaded) << uploaded.detail;
    EXPECT_TRUE(uploaded.answer);
  }
  // The session's start, the message, the log data's location, the end.
  auto datagrams = _harness->waitForDatagrams([](const auto& all) { return all.size() >= 4; });
  ASSERT_EQ(datagrams.size(), 4u);
  EXPECT_EQ(datagrams[1].at("payload").as_object(), (boost::json::object{{"n", "1"}, {"text", "a=b\\c"}}));
  EXPECT_EQ(datagrams[1].at("sender"), "HD");
  EXPECT_EQ(datagrams[1].at("sessionID"), 77);
  EXPECT_EQ(datagrams[2].at("status"), 2);
  const std::string location(datagrams[2].at("payload").at("LogDataUploadLocation").as_string());
  ChildProcess show({VESK_BIN_DIRECTORY "/veskcollector", "show", location});
  EXPECT_EQ(show.wait(), 0) << show.errors();
  EXPECT_EQ(show.output(), "list of 2\n  - \"log\"\n  - 1970-01-01 00:00:01.000 UTC\n");
}

TEST_F(DashboardRoad, EverythingArrivesThoughThreeInTenAreLostBothWays) {
  constexpr int kMessages = 1000;
  constexpr int kAtOnce = 25;  // half of the daemon's limit
  start({"--ack-loss", "0.3", "--seed", "1"}, "5");
  RoadClient client(*_harness);
  for (int n = 0; n < kMessages; ++n) {
    ASSERT_TRUE(queued(client.reporting.sendMessage(3, 1, Dictionary{{"n", n}})));
    if ((n + 1) % kAtOnce != 0) continue;
    auto all = _harness->waitForDatagrams(
        [&](const auto& datagrams) { return static_cast<int>(numbersIn(datagrams).size()) == n + 1; });
    if (n + 1 < kMessages) continue;
    std::set<std::int64_t> events;
    int again = 0;
    for (const auto& datagram : all) {
      EXPECT_EQ(datagram.at("again").as_bool(), !events.insert(datagram.at("eventID").as_int64()).second);
      again += datagram.at("again").as_bool();
    }
    EXPECT_GT(again, 200) << "three in ten acknowledgements are lost";
  }
  EXPECT_GT(_harness->collectorCount("datagramsLost"), 300);
  EXPECT_GT(_harness->collectorCount("acknowledgementsLost"), 200);
}

TEST_F(DashboardRoad, TerminationSendsTheEndOfTheSessionAndWaitsForNothingElse) {
  start({}, "100");
  RoadClient client(*_harness);
  EXPECT_EQ(_harness->stopDaemon(), 0);
  auto datagrams = _harness->waitForDatagrams([](const auto& all) { return all.size() >= 2; });
  EXPECT_EQ(datagrams.back().at("status"), 1);
  EXPECT_EQ(datagrams.back().at("payload").at("StorebagVersion"), "1");
}

}  // namespace
}  // namespace vesk::test
