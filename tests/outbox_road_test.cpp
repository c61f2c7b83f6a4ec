// Outages, kills and restarts with the real daemon and collector: every confirmed event arrives.
#include <gtest/gtest.h>

#include <csignal>
#include <filesystem>
#include <map>
#include <regex>

#include "tests/support/DaemonHarness.h"

namespace vesk::test {
namespace {

class OutboxRoad : public testing::Test {
 protected:
  /// Sends events, each answered by the daemon, while the collector is away.
  void sendInAnOutage(int first, int count) {
    harness.stopCollector();
    for (int n = first; n < first + count; ++n) {
      const auto sent = client->reporting.sendMessageAndWait(message(3, Dictionary{{"n", n}}, 1));
      ASSERT_TRUE(sent) << sent.detail;
    }
  }
  /// Starts the daemon and a session, whose first message has arrived when this returns.
  void start(const Dictionary& sessionInfo = {}, const std::optional<Dictionary>& userInfo = std::nullopt) {
    harness.startDaemon();
    client.emplace(harness, sessionInfo, userInfo);
    ASSERT_TRUE(client->reporting.sendMessageAndWait(message(9, {}, 1)));
    harness.waitForEventsOfMethod(9, ++sessions);
  }
  void restart() {
    client.reset();
    harness.startCollector();
    start();
  }
  std::size_t putAside() {
    static const std::regex line("Outbox: ([0-9]+) posts are put aside");
    const std::string log = harness.daemon().errors();
    std::size_t sum = 0;
    for (std::sregex_iterator each(log.begin(), log.end(), line), end; each != end; ++each) {
      sum += std::stoul((*each)[1]);
    }
    return sum;
  }
  /// Waits for the events 0 to `count` - 1, each of which must have arrived once.
  void expectAllOnce(int count) {
    std::map<std::int64_t, int> arrivals;
    for (const auto& each : harness.waitForEventsOfMethod(3, count))
      ++arrivals[each.at("event").at("n").as_int64()];
    EXPECT_EQ(arrivals.size(), static_cast<std::size_t>(count));
    for (const auto& [n, times] : arrivals) EXPECT_EQ(times, 1) << n;
  }

  DaemonHarness harness;
  std::optional<RoadClient> client;
  int sessions = 0;
};

TEST_F(OutboxRoad, ConfirmedEventsSurviveAKillAndAStop) {
  start();
  sendInAnOutage(0, 10);
  ASSERT_TRUE(eventually([&] { return putAside() >= 10; })) << harness.daemon().errors();
  harness.daemon().signal(SIGKILL);
  (void)harness.daemon().wait();
  restart();
  expectAllOnce(10);

  sendInAnOutage(10, 10);
  EXPECT_EQ(harness.stopDaemon(), 0);
  EXPECT_NE(harness.daemon().errors().find("main: Delayed since the start: httpPost deferred 1"),
            std::string::npos);
  restart();
  expectAllOnce(20);
}

TEST_F(OutboxRoad, WithoutAnOutboxWhatCanNotBeDeliveredIsLostAndCounted) {
  harness.setPreference("outbox", "\"off\"");
  start();
  sendInAnOutage(0, 2);
  EXPECT_EQ(harness.stopDaemon(), 0);
  EXPECT_NE(harness.daemon().errors().find("main: Lost since the start: httpPost transport-error 3\n"),
            std::string::npos)
      << "with the session's last message: " << harness.daemon().errors();
  EXPECT_FALSE(std::filesystem::exists(harness.root / "var/lib/veskreportingd/outbox.sqlite"));
}

TEST_F(OutboxRoad, ADeviceThatStartsWithoutANetworkReports) {
  harness.setPreference("keepStorebags", "true");
  start();
  EXPECT_EQ(harness.stopDaemon(), 0);
  client.reset();
  harness.stopCollector();
  harness.startDaemon();
  client.emplace(harness);
  ASSERT_TRUE(client->enabled) << harness.daemon().errors();
  ASSERT_TRUE(client->reporting.sendMessageAndWait(message(3, Dictionary{{"n", 0}}, 1)));
  EXPECT_EQ(harness.stopDaemon(), 0);
  restart();
  expectAllOnce(1);
}

TEST_F(OutboxRoad, WithdrawnConsentDeletesWhatWaits) {
  harness.writeStorebag("zelko", R"(
version = "1"
[[release.httpPost.clients]]
client = "Camera"
locale_whitelist = ["US"]
sampling_threshold = 1.0
expedite = 0
post_url = "@EVENTS@"
[[release.httpPost.clients.filters]]
key = "secret"
action = "remove"
)");
  const Dictionary user{{kVeskReportingUserInfoClientName, "Camera"}};
  start(Dictionary{{kVeskReportingSessionInfoRequireUserInfo, true}}, user);
  sendInAnOutage(0, 3);
  EXPECT_EQ(harness.stopDaemon(), 0);
  client.reset();
  harness.setPreference("diagnosticsSubmission", "false");
  harness.startCollector();
  harness.startDaemon();
  EXPECT_EQ(harness.stopDaemon(), 0);
  EXPECT_NE(harness.daemon().errors().find("main: Lost since the start: httpPost consent-withdrawn"),
            std::string::npos)
      << harness.daemon().errors();
}

}  // namespace
}  // namespace vesk::test
