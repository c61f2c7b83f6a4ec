// Dashboards on real processes: client library, daemon in its sandbox, collector; loss, outages and ends.
#include <gtest/gtest.h>

#include <set>

#include "tests/support/DaemonHarness.h"

namespace vesk::test {
namespace {

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
  // The session's start, the message, the announcement, the end.
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
  constexpr int kAtOnce = 25;  // half of what the daemon keeps
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
