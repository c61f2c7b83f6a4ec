// The power log: what the backend records, what the file keeps, and how it fares on the real daemon.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/resource.h>

#include <csignal>
#include <fstream>
#include <thread>

#include "platform/powerlog/PowerLog.h"
#include "platform/powerlog/PowerLogReader.h"
#include "tests/support/BackendHarness.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/DaemonHarness.h"
#include "tests/support/TempDirectory.h"
#include "tools/veskreport/PowerLogCommand.h"

namespace vesk::test {
namespace {

namespace fs = std::filesystem;

class PowerLogTest : public testing::Test {
 protected:
  PowerLog::Options options() {
    PowerLog::Options made;
    made.path = path;
    made.clock = &clock;
    made.uptime = [this] { return uptime; };
    made.onLost = [this](std::uint64_t events) { lost += events; };
    return made;
  }
  void pass(std::chrono::seconds time) {
    clock.advance(time);
    uptime += time;
  }
  void record(PowerLog& powerLog, Dictionary dictionary = {{"k", 1}}) {
    powerLog.KLLogRegisteredEvent(28, "Rookery-Vesk", dictionary, std::nullopt);
    powerLog.flush();
  }
  void recordWithoutRoom(PowerLog& powerLog) {
    rlimit before{};
    ::getrlimit(RLIMIT_FSIZE, &before);
    ::signal(SIGXFSZ, SIG_IGN);
    rlimit full = before;
    full.rlim_cur = 1;
    ::setrlimit(RLIMIT_FSIZE, &full);
    record(powerLog);
    ::setrlimit(RLIMIT_FSIZE, &before);
  }
  std::vector<PowerLogEvent> events(WallTime since = {}) const {
    std::vector<PowerLogEvent> all;
    EXPECT_EQ(readPowerLog(path, since,
                           [&](const PowerLogEvent& event) {
                             all.push_back(event);
                             return true;
                           }),
              "");
    return all;
  }

  TempDirectory directory;
  const std::string path = directory.path() / "power-log.sqlite";
  HandClock clock;
  std::chrono::seconds uptime{60};
  std::atomic<std::uint64_t> lost{0};
};

TEST_F(PowerLogTest, TheBackendRecordsMessagesThatHaveMethodAndPayload) {
  BackendHarness harness;
  harness.services.powerLog = std::make_shared<PowerLog>(options());
  auto backend =
      VeskReportingBackend::newBackendWithName("kilnar", std::nullopt, std::nullopt, 5, harness.services);
  ASSERT_TRUE(backend);
  auto send = [&](std::uint16_t method, const std::optional<Dictionary>& payload) {
    EXPECT_EQ(backend->sendMessage(payload, timeval{}, method, 200, 0), std::nullopt);
  };
  send(0, Dictionary{{"k", 1}});
  send(5, Dictionary());
  send(5, std::nullopt);
  send(5, Dictionary{{"k", "v"}});
  send(65535,
       Dictionary{{"event", "theirs"}, {"bytes", Bytes("\x01\x02")}, {"list", List{0.5, HUGE_VAL, Value()}}});
  harness.services.powerLog->flush();
  auto recorded = events();
  ASSERT_EQ(recorded.size(), 2u);
  EXPECT_EQ(recorded[0].identifier, 28u);
  EXPECT_EQ(recorded[0].name, "Rookery-Vesk");
  EXPECT_EQ(recorded[0].time, clock.now());
  EXPECT_EQ(recorded[0].dictionary, R"({"k":"v","method":5,"respCode":200,"event":4})");
  EXPECT_EQ(recorded[1].dictionary,
            R"({"event":5,"bytes":"AQI=","list":[0.5,-1.0,null],"method":65535,"respCode":200})");
}

TEST_F(PowerLogTest, KeepsWhatIsYoungEnoughAndNotTooMuch) {
  PowerLog::Options few = options();
  few.maximumRows = 3;
  few.maximumEvent = 100;
  PowerLog powerLog(few);
  for (int i = 0; i < 5; ++i) {
    record(powerLog, {{"i", i}});
    pass(std::chrono::days(1));
  }
  ASSERT_EQ(events().size(), 3u);
  EXPECT_EQ(events().at(0).dictionary, R"({"i":2})");
  EXPECT_EQ(events(clock.now() - std::chrono::days(2)).size(), 2u);
  pass(std::chrono::days(4));  // the last but one is 8 days old, less one
  record(powerLog, {{"i", 5}});
  EXPECT_EQ(events().size(), 3u);
  pass(std::chrono::days(5));
  record(powerLog, {{"i", 6}});
  EXPECT_EQ(events().size(), 2u);
  EXPECT_EQ(lost, 0u);
  record(powerLog, {{"text", std::string(100, 'x')}});
  EXPECT_EQ(lost, 1u) << "too large";
}

TEST_F(PowerLogTest, SettingTheClockDeletesNothingOfThisRun) {
  {
    PowerLog powerLog(options());
    record(powerLog);
    clock.advance(std::chrono::days(30));
    record(powerLog);
    EXPECT_EQ(events().size(), 2u);
    pass(std::chrono::days(7) + std::chrono::hours(1));
    record(powerLog);
    EXPECT_EQ(events().size(), 1u) << "as old as they can be";
  }
  uptime = std::chrono::seconds(60);  // another boot
  clock.advance(std::chrono::days(8));
  PowerLog powerLog(options());
  record(powerLog);
  EXPECT_EQ(events().size(), 1u);
}

TEST_F(PowerLogTest, BeginsADamagedFileAnewAndKeepsTheOldOne) {
  CapturedLog log;
  const std::string garbage(20'000, '#');
  directory.write("power-log.sqlite", garbage);
  {
    PowerLog powerLog(options());
    record(powerLog);
    EXPECT_EQ(events().size(), 1u);
    EXPECT_EQ(directory.read("power-log.sqlite.corrupt"), garbage);
    for (int i = 0; i < 200; ++i) record(powerLog, {{"k", std::string(500, 'x')}});
  }
  {
    std::fstream file(path, std::ios::in | std::ios::out | std::ios::binary);
    file.seekp(16'384);
    file << garbage;
  }
  PowerLog powerLog(options());
  record(powerLog);
  EXPECT_EQ(events().size(), 1u);
  EXPECT_EQ(log.countContaining(3, "is damaged"), 2);

  for (const char* suffix : {"", "-wal", "-shm"}) fs::rename(path + suffix, path + ".corrupt" + suffix);
  record(powerLog);
  EXPECT_EQ(events().size(), 1u) << "as when another daemon was the first to find the damage";
  EXPECT_EQ(lost, 0u);
}

TEST_F(PowerLogTest, DamageThatComesLaterIsMetWhereItIs) {
  CapturedLog log;
  for (int i = 0; i < 2; ++i) record(*std::make_unique<PowerLog>(options()), {{"k", std::string(9000, 'x')}});
  PowerLog powerLog(options());
  record(powerLog);
  recordWithoutRoom(powerLog);  // which makes it open the file again
  for (const char* suffix : {"-wal", "-shm"}) fs::remove(path + suffix);
  const auto size = fs::file_size(path);
  fs::resize_file(path, 4096);
  fs::resize_file(path, size);
  record(powerLog);
  EXPECT_EQ(log.countContaining(3, "is damaged"), 1);
  EXPECT_EQ(events().size(), 1u);
  EXPECT_EQ(lost, 1u);
}

TEST_F(PowerLogTest, OneThatCanNotBeMovedAwayCostsOneLine) {
  CapturedLog log;
  directory.write("power-log.sqlite", std::string(20'000, '#'));
  directory.write("power-log.sqlite.corrupt/in the way", "");
  PowerLog powerLog(options());
  for (int i = 0; i < 3; ++i) record(powerLog);
  EXPECT_EQ(lost, 3u);
  EXPECT_EQ(log.countContaining(3, "PowerLog: "), 1);
  EXPECT_EQ(log.countContaining(3, "can't be moved: Is a directory; events are lost"), 1);
  fs::remove_all(path + ".corrupt");
  record(powerLog);
  EXPECT_EQ(lost, 3u);
}

TEST_F(PowerLogTest, AFrozenProcessHoldsUpNobodyForGood) {
  FileDescriptor lock(::open((path + ".lock").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
  ASSERT_EQ(::flock(lock.get(), LOCK_EX), 0);
  PowerLog::Options hasty = options();
  hasty.patience = std::chrono::milliseconds(20);
  PowerLog(hasty).KLLogRegisteredEvent(28, "Rookery-Vesk", Dictionary(), std::nullopt);
  EXPECT_EQ(lost, 1u);
}

TEST_F(PowerLogTest, AReaderThatStandsStillIsNotInTheWriterSWay) {
  PowerLog powerLog(options());
  for (int i = 0; i < 600; ++i) record(powerLog, {{"i", i}});
  std::size_t seen = 0;
  auto take = [&](const PowerLogEvent&) {
    for (int i = 0; seen == 0 && i < 250; ++i) record(powerLog, {{"k", std::string(60'000, 'x')}});
    return ++seen > 0;
  };
  EXPECT_EQ(readPowerLog(path, {}, take), "");
  EXPECT_EQ(seen, 600u);
  EXPECT_LT(fs::file_size(path + "-wal"), 8u << 20) << "of 15 MB";
}

TEST_F(PowerLogTest, TwoWritersShareIt) {
  auto write = [this] {
    PowerLog powerLog(options());
    for (int i = 0; i < 300; ++i) record(powerLog);
  };
  std::thread other(write);
  write();
  other.join();
  EXPECT_EQ(lost, 0u);
  EXPECT_EQ(events().size(), 600u);
}

TEST_F(PowerLogTest, WithoutRoomEventsAreLostAndCounted) {
  PowerLog powerLog(options());
  record(powerLog);
  recordWithoutRoom(powerLog);
  EXPECT_EQ(lost, 1u);
  record(powerLog);
  EXPECT_EQ(lost, 1u) << "it is over";
  EXPECT_EQ(events().size(), 2u);
  PowerLog::Options nowhere = options();
  nowhere.path = path + "/below-a-file";
  PowerLog unwritable(nowhere);
  record(unwritable);
  EXPECT_EQ(lost, 2u);
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
  ChildProcess full(
      {"/bin/sh", "-c",
       "exec " VESK_BIN_DIRECTORY "/veskreport power-log >/dev/full --root " + harness.root.path().string()});
  EXPECT_EQ(full.wait(), 1);
  EXPECT_EQ(full.errors(), "veskreport: cannot write to standard output\n");
  EXPECT_EQ(show({"--since", "2999-01-01"}), "");
}

TEST(PowerLogCommandTest, UnderstandsAgesAndTimes) {
  const WallTime now = std::chrono::sys_days(std::chrono::days(20'000));
  using namespace std::chrono_literals;
  const std::pair<const char*, std::optional<WallTime>> cases[] = {
      {"30s", now - 30s},
      {"2h", now - 2h},
      {"7d", now - 168h},
      {"4294967295d", now - 24h * 100'000},
      {"1970-01-02", WallTime(24h)},
      {"1970-01-01T01:02:03Z", WallTime(1h + 2min + 3s)},
      {"1970-01-01 01:02:03", WallTime(1h + 2min + 3s)},
      {"", std::nullopt},
      {"s", std::nullopt},
      {"-3s", std::nullopt},
      {"3w", std::nullopt},
      {"1970-02-30", std::nullopt},
      {"1970-01-01T01:02", std::nullopt},
      {"1970-01-01x", std::nullopt},
  };
  for (const auto& [text, meant] : cases) EXPECT_EQ(timeMeantBy(text, now), meant) << text;
}

}  // namespace
}  // namespace vesk::test
