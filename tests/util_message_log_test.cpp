#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <atomic>
#include <set>
#include <thread>

#include "tests/support/CapturedLog.h"
#include "tests/support/TempDirectory.h"
#include "util/MessageLog.h"

namespace vesk::test {
namespace {

using std::chrono::microseconds;
using std::chrono::seconds;

class SetClock final : public WallClock {
 public:
  WallTime now() const override { return time.load(); }
  std::atomic<WallTime> time{WallTime(seconds(1'795'552'289))};
};

WallTime birth(const std::filesystem::path& path) {
  struct statx status {};
  EXPECT_EQ(::statx(AT_FDCWD, path.c_str(), 0, STATX_BTIME, &status), 0);
  return WallTime(seconds(status.stx_btime.tv_sec) + microseconds(status.stx_btime.tv_nsec / 1000));
}

class MessageLogTest : public testing::Test {
 protected:
  std::set<std::string> files() const {
    std::set<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(_logs))
      names.insert(entry.path().filename());
    return names;
  }
  std::string path(const std::string& name) const { return (_logs / name).string(); }
  std::string read(const std::string& name) const { return _root.read("logs/" + name); }
  static std::string fileName(WallTime time) {
    return "veskreportingd_" + std::to_string(std::chrono::floor<seconds>(time).time_since_epoch().count()) +
           "_messageLog.diag";
  }
  /// An empty log file that is younger than `than`.
  std::string makeYounger(const std::string& name, WallTime than) const {
    do {
      std::filesystem::remove(_logs / name);
      _root.write("logs/" + name, "");
    } while (birth(_logs / name) <= than);
    return name;
  }

  TempDirectory _root;
  std::filesystem::path _logs = _root / "logs";
  SetClock _clock;
  MessageLog _log{_logs.string(), _clock};
  CapturedLog _lines;
};

TEST_F(MessageLogTest, StartsOneFileAndAppendsToIt) {
  _log.write("first");
  _clock.time = _clock.time.load() + seconds(90);
  _log.write("second\nwith two lines");
  const std::string name = "veskreportingd_1795552289_messageLog.diag";
  EXPECT_EQ(files(), std::set<std::string>{name});
  EXPECT_EQ(read(name),
            "(2026-11-24 20:31:29 +0000) first\n(2026-11-24 20:32:59 +0000) second\nwith two lines\n");
  const std::string created = logDate(birth(_logs / name));
  const std::vector<std::pair<int, std::string>> expected = {
      {6, "writeToLogFile: Creating veskreportingd log directory at " + _logs.string()},
      {6, "writeToLogFile: Created new veskreportingd log file " + path(name) + " (" + created + ")"},
      {6, "writeToLogFile: Saved log message to " + path(name)},
      {6, "writeToLogFile: Saved log message to " + path(name)},
  };
  EXPECT_EQ(_lines.lines(), expected);
  struct stat status {};
  ASSERT_EQ(::stat(path(name).c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 0137, 0u);
}

TEST_F(MessageLogTest, ReplacesAFileOlderThanADay) {
  const std::string old = "veskreportingd_whatever_messageLog.diag";
  _root.write("logs/" + old, "kept so far\n");
  const WallTime created = birth(_logs / old);
  _clock.time = created + seconds(86'400);
  _log.write("on the edge");
  EXPECT_EQ(files(), std::set<std::string>{old});
  _clock.time = created + seconds(86'400) + microseconds(1);
  _log.write("beyond it");
  EXPECT_EQ(files(), std::set<std::string>{fileName(_clock.time.load())});
  EXPECT_EQ(_lines.count(6, "writeToLogFile: Deleted expired veskreportingd log file " + path(old) + " (" +
                                logDate(created) + ")"),
            1);
}

TEST_F(MessageLogTest, WithoutABirthTimeAFileIsAsOldAsItsNameSays) {
  struct statx status {};
  status.stx_btime.tv_sec = 1000;
  status.stx_mtime.tv_sec = 2000;
  struct Case {
    unsigned mask;
    std::string name;
    std::optional<WallTime> created;
  };
  const std::string number = "veskreportingd_1795552289_messageLog.diag";
  const std::string late = "veskreportingd_-2147483648_messageLog.diag";
  const std::string text = "veskreportingd_1x_messageLog.diag";
  for (const auto& test : {Case{STATX_BTIME | STATX_MTIME, number, WallTime(seconds(1000))},
                           Case{STATX_MTIME, number, WallTime(seconds(1'795'552'289))},
                           Case{STATX_MTIME, late, WallTime(seconds(2'147'483'648))},
                           Case{STATX_MTIME, text, WallTime(seconds(2000))}, Case{0, text, std::nullopt}}) {
    status.stx_mask = test.mask;
    EXPECT_EQ(logFileCreationDate(status, test.name), test.created) << test.mask << test.name;
  }
}

TEST_F(MessageLogTest, AFileThatIsFullTakesNoMore) {
  Counters counters;
  MessageLog log(_logs.string(), _clock, {.maximumBytes = 100, .counters = &counters});
  for (int i = 0; i < 4; ++i) log.write("a line of 20 letters");
  const std::string name = *files().begin();
  EXPECT_EQ(read(name).size(), 98u);
  ASSERT_EQ(counters.snapshot().size(), 1u);
  EXPECT_EQ(counters.snapshot()[0].reason, DropReason::NotRecorded);
  EXPECT_EQ(counters.snapshot()[0].count, 2u);
  EXPECT_EQ(_lines.count(4, "writeToLogFile: No room in " + path(name) + " until it expires; lines are lost"),
            1);
}

TEST_F(MessageLogTest, KeepsTheNewestFileOnly) {
  std::string newest = "veskreportingd_9_messageLog.diag";
  _root.write("logs/" + newest, "");
  for (const char* name : {"veskreportingd_5_messageLog.diag", "veskreportingd__messageLog.diag"}) {
    newest = makeYounger(name, birth(_logs / newest));
  }
  _clock.time = birth(_logs / newest);
  _log.write("message");
  EXPECT_EQ(files(), std::set<std::string>{newest});
  EXPECT_EQ(_lines.countContaining(6, "writeToLogFile: Deleted expired veskreportingd log file "), 2);
}

TEST_F(MessageLogTest, LeavesOtherFilesAlone) {
  const std::set<std::string> others = {
      "veskreportingd_messageLog.diag", "veskreportingd_1_2_messageLog.diag", "other_1_messageLog.diag",
      "veskreportingd_1_messageLog.txt", "veskreportingd_1_messageLog.diag_"};
  for (const auto& name : others) _root.write("logs/" + name, "theirs");
  _log.write("message");
  for (const auto& name : others) EXPECT_EQ(read(name), "theirs");
  EXPECT_EQ(files().size(), others.size() + 1);
}

TEST_F(MessageLogTest, FollowsNoLinkOutOfItsDirectory) {
  _root.write("victim", "untouched");
  std::filesystem::create_directory(_logs);
  const std::string link = "veskreportingd_1_messageLog.diag";
  std::filesystem::create_symlink(_root / "victim", _logs / link);
  _log.write("lost");
  EXPECT_EQ(_root.read("victim"), "untouched");
  EXPECT_EQ(files(), std::set<std::string>{});
  EXPECT_EQ(
      _lines.countContaining(6, "writeToLogFile: Deleted expired veskreportingd log file " + path(link)), 1);
  EXPECT_EQ(_lines.countContaining(6, "writeToLogFile: Saved"), 0);
  _log.write("saved");
  EXPECT_EQ(files().size(), 1u);
}

TEST_F(MessageLogTest, NeitherMixesNorLosesLinesOfSeveralThreads) {
  constexpr int kThreads = 4;
  constexpr int kLines = 50;
  std::vector<std::thread> threads;
  for (int i = 0; i < kThreads; ++i) {
    threads.emplace_back([&, i] {
      MessageLog log(_logs.string(), _clock);
      for (int k = 0; k < kLines; ++k) log.write(std::string(2000, static_cast<char>('a' + i)));
    });
  }
  for (auto& thread : threads) thread.join();
  ASSERT_EQ(files().size(), 1u);
  std::istringstream text(read(*files().begin()));
  std::string line;
  int count = 0;
  for (; std::getline(text, line); ++count) {
    ASSERT_EQ(line.size(), 2000 + std::string("(2026-11-24 20:31:29 +0000) ").size());
    EXPECT_EQ(std::count(line.begin(), line.end(), line.back()), 2000);
  }
  EXPECT_EQ(count, kThreads * kLines);
}

TEST(LogFormat, ShowsEveryValueByItsOwnType) {
  const auto format = [](std::string_view text, std::vector<LogArgument> arguments = {}) {
    return formatLogMessage(text, arguments);
  };
  const std::optional<std::string> none;
  EXPECT_EQ(format("[%@ -> %@] %@", {"a", std::string_view("b"), none}), "[a -> b] (null)");
  EXPECT_EQ(format("%@ %@ %@ %@", {1, UINT64_MAX, -2.5, true}), "1 18446744073709551615 -2.5 1");
  EXPECT_EQ(format("%d %5d|%-5d|%05d", {-1, 2, 3, 4}), "-1     2|3    |00004");
  EXPECT_EQ(format("%u %x %#X %llu %ld", {7u, 255, 255u, UINT64_MAX, -1L}),
            "7 ff 0XFF 18446744073709551615 -1");
  EXPECT_EQ(format("%.2f %g %f", {1.005, 0.5, 3}), "1.00 0.5 3.000000");
  EXPECT_EQ(format("100%% %@%%", {"x"}), "100% x%");
  // What does not fit still shows its value, and nothing reads what is not there.
  EXPECT_EQ(format("%d %f %s", {"text", "text", 5}), "text text 5");
  EXPECT_EQ(format("%d %u", {1.5, -1}), "1.5 -1");
  EXPECT_EQ(format("%@ %@ %d", {"one"}), "one %@ %d");
  EXPECT_EQ(format("%@", {"one", "two"}), "one");
  EXPECT_EQ(format("%", {"x"}), "%");
  EXPECT_EQ(format("%n %p %*d", {"x", "y", 1}), "%n %p %*d");
  EXPECT_EQ(format("%999999999999d", {1}).size(), 256u);
  EXPECT_EQ(format("%.99999f", {1e300}).substr(0, 3), "100");
  EXPECT_EQ(format("%@", {"%@ %s %n"}), "%@ %s %n");
}

}  // namespace
}  // namespace vesk::test
