// The power log: what the backend records, what the file keeps, and its use by the real daemon.
#include <gtest/gtest.h>

#include "backends/BackendFactory.h"
#include "platform/powerlog/PowerLog.h"
#include "tests/support/BackendHarness.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/DaemonHarness.h"
#include "tests/support/TempDirectory.h"
#include "tools/veskreport/PowerLogReader.h"

namespace vesk::test {
namespace {

class PowerLogTest : public testing::Test {
 protected:
  PowerLog::Options options() {
    PowerLog::Options made;
    made.path = path;
    made.clock = &clock;
    made.onLost = [this](std::uint64_t events) { lost += events; };
    return made;
  }
  void record(PowerLog& powerLog, Dictionary dictionary = {{"k", 1}}) {
    powerLog.KLLogRegisteredEvent(28, "Rookery-Vesk", dictionary, std::nullopt);
    powerLog.flush();
  }
  std::vector<PowerLogEvent> events(WallTime since = {}) const {
    auto read = readPowerLog(path, since);
    EXPECT_TRUE(read);
    return read ? *read : std::vector<PowerLogEvent>();
  }

  TempDirectory directory;
  const std::string path = directory.path() / "power-log.sqlite";
  HandClock clock;
  std::atomic<std::uint64_t> lost{0};
};

TEST_F(PowerLogTest, TheBackendRecordsMessagesThatHaveMethodAndPayload) {
  BackendHarness harness;
  CapturedLog log;
  harness.services.powerLog = std::make_shared<PowerLog>(options());
  auto backend = newBackendWithName("kilnar", std::nullopt, {}, harness.services);
  ASSERT_TRUE(backend);
  const std::tuple<std::uint16_t, std::optional<Dictionary>, const char*> cases[] = {
      {5, Dictionary{{"k", "v"}}, R"({"k":"v","method":5,"respCode":200,"event":1})"},
      {0, Dictionary{{"k", 1}}, nullptr},
      {5, Dictionary(), nullptr},
      {5, std::nullopt, nullptr},
      {65535,
       Dictionary{{"event", "theirs"}, {"bytes", Bytes("\x01\x02")}, {"list", List{0.5, HUGE_VAL, Value()}}},
       R"({"event":5,"bytes":"AQI=","list":[0.5,-1.0,null],"method":65535,"respCode":200})"},
      {1, Dictionary{{"respCode", 1}, {"method", 2}, {"event", 3}},
       R"({"respCode":200,"method":1,"event":6})"},
  };
  std::size_t count = 0;
  for (const auto& [method, payload, recorded] : cases) {
    EXPECT_EQ(backend->sendMessage(payload, timeval{}, method, 200, 3), std::nullopt);
    harness.services.powerLog->flush();
    ASSERT_EQ(events().size(), count += recorded ? 1u : 0u);
    EXPECT_TRUE(!recorded || events().back().dictionary == recorded);
  }
  EXPECT_EQ(events().back().time, clock.now());
  EXPECT_EQ(log.lines().size(), 0u);
  harness.services.powerLog = nullptr;
  auto without = newBackendWithName("kilnar", Dictionary(), {}, harness.services);
  EXPECT_EQ(without->sendMessage(Dictionary{{"k", 1}}, timeval{}, 5, 200, 0), std::nullopt);
}

TEST_F(PowerLogTest, KeepsWhatIsYoungEnoughAndNotTooMuch) {
  PowerLog::Options few = options();
  few.maximumRows = 3;
  few.maximumEvent = 100;
  PowerLog powerLog(few);
  for (int i = 0; i < 5; ++i) {
    record(powerLog, {{"i", i}});
    clock.advance(std::chrono::days(1));
  }
  ASSERT_EQ(events().size(), 3u);
  EXPECT_EQ(events().at(0).dictionary, R"({"i":2})");
  EXPECT_EQ(events(clock.now() - std::chrono::days(2)).size(), 2u);
  clock.advance(std::chrono::days(9));
  record(powerLog, {{"i", 5}});
  EXPECT_EQ(events().size(), 1u);
  record(powerLog, {{"text", std::string(100, 'x')}});
  EXPECT_EQ(lost, 1u) << "too large";
  few.path = path + "/below-a-file";
  PowerLog unwritable(few);
  record(unwritable);
  EXPECT_EQ(lost, 2u);
}

TEST_F(PowerLogTest, BeginsADamagedFileAnew) {
  std::ofstream(path) << std::string(4096, 'x');
  PowerLog powerLog(options());
  CapturedLog log;
  record(powerLog);
  record(powerLog);
  EXPECT_EQ(events().size(), 2u);
  EXPECT_EQ(lost, 0u);
  EXPECT_TRUE(std::filesystem::exists(path + ".corrupt"));
  EXPECT_EQ(log.lines().size(), 1u);
  std::filesystem::remove(path);
  record(powerLog);
  EXPECT_EQ(events().size(), 1u) << "after somebody removed it";
}

TEST(PowerLogRoad, TheDaemonRecordsAndTheToolShows) {
  DaemonHarness harness;
  harness.writeStorebag("zelko", "version = \"1\"\n[release.kilnar]\n");
  harness.startDaemon();
  {
    RoadClient client(harness);
    EXPECT_EQ(client.enabled, BackendNames{"kilnar"});
    EXPECT_TRUE(client.reporting.sendMessageAndWait(5, 7, Dictionary{{"k", "v\u009b"}}));
  }
  EXPECT_EQ(harness.stopDaemon(), 0);
  auto show = [&](std::vector<std::string> more) {
    std::vector<std::string> command{VESK_BIN_DIRECTORY "/veskreport", "power-log", "--root",
                                     harness.root.path()};
    command.insert(command.end(), more.begin(), more.end());
    ChildProcess tool(std::move(command));
    EXPECT_EQ(tool.wait(), 0) << tool.errors();
    return tool.output();
  };
  auto line = boost::json::parse(show({"--json", "--since", "1h"})).as_object();
  EXPECT_EQ(line.at("name"), "Rookery-Vesk");
  EXPECT_EQ(line.at("dictionary"),
            boost::json::parse("{\"k\":\"v\u009b\",\"method\":5,\"respCode\":7,\"event\":2}"));
  EXPECT_NE(show({}).find(R"(  28 Rookery-Vesk  {"k":"v\xc2\x9b")"), std::string::npos);
  EXPECT_EQ(show({"--since", "2999-01-01"}), "");
}

}  // namespace
}  // namespace vesk::test
