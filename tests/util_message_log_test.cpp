#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <csignal>
#include <functional>
#include <map>
#include <set>

#include "tests/support/CapturedLog.h"
#include "tests/support/TestRoot.h"
#include "util/MessageLog.h"

namespace vesk::test {
namespace {

namespace fs = std::filesystem;
using std::chrono::hours;
using std::chrono::microseconds;
using std::chrono::seconds;
using Names = std::set<std::string>;
using Lines = std::vector<std::pair<int, std::string>>;

constexpr char kFirst[] = "veskreportingd_1795552289_messageLog.diag";

class SetClock final : public WallClock {
 public:
  WallTime now() const override { return time; }
  WallTime time{seconds(1'795'552'289)};
};

WallTime birth(const fs::path& path) {
  struct statx status {};
  EXPECT_EQ(::statx(AT_FDCWD, path.c_str(), AT_SYMLINK_NOFOLLOW, STATX_BTIME, &status), 0);
  return WallTime(seconds(status.stx_btime.tv_sec) + microseconds(status.stx_btime.tv_nsec / 1000));
}

class MessageLogTest : public testing::Test {
 protected:
  Names files() const {
    Names names;
    for (const auto& entry : fs::directory_iterator(_logs)) names.insert(entry.path().filename());
    return names;
  }
  std::string path(const std::string& name) const { return (_logs / name).string(); }
  std::string read(const std::string& name) const { return _root.read("logs/" + name); }
  void make(const std::string& name) const { _root.write("logs/" + name, "before\n"); }
  /// Creates the file again until it is younger than `other`.
  void makeYounger(const std::string& name, const std::string& other) const {
    do {
      fs::remove(_logs / name);
      make(name);
    } while (birth(_logs / name) == birth(_logs / other));
  }
  std::string deleted(const std::string& name, const std::string& date) const {
    return "writeToLogFile: Deleted expired veskreportingd log file " + path(name) + " (" + date + ")";
  }
  /// Makes the directory's last change look `age` old.
  void setAge(seconds age) const {
    const auto when = std::chrono::system_clock::now() - age;
    const timespec time{std::chrono::system_clock::to_time_t(when), 0};
    const timespec times[] = {time, time};
    ASSERT_EQ(::utimensat(AT_FDCWD, _logs.c_str(), times, 0), 0);
  }
  bool isOpen(const std::string& name) const {
    std::error_code gone;
    for (const auto& entry : fs::directory_iterator("/proc/self/fd"))
      if (fs::read_symlink(entry, gone) == path(name)) return true;
    return false;
  }
  std::uint64_t lost() const {
    std::uint64_t sum = 0;
    for (const auto& count : _counters.snapshot())
      if (count.backend == "message-log" && count.reason == DropReason::NotRecorded) sum += count.count;
    return sum;
  }
  /// Writes a line while files are limited to 20 bytes.
  void writeWithoutRoom(MessageLog& log) const {
    ::signal(SIGXFSZ, SIG_IGN);
    rlimit before{};
    ::getrlimit(RLIMIT_FSIZE, &before);
    const rlimit full{20, before.rlim_max};
    ::setrlimit(RLIMIT_FSIZE, &full);
    log.write("this line is lost");
    ::setrlimit(RLIMIT_FSIZE, &before);
  }

  TempDirectory _root;
  fs::path _logs = _root / "logs";
  SetClock _clock;
  Counters _counters;
  MessageLog _log{_logs.string(), _clock, {.maximumBytes = 1000, .counters = &_counters}};
  CapturedLog _lines;
};

TEST_F(MessageLogTest, StartsOneFileAndAppendsToIt) {
  _log.write("first");
  _clock.time += seconds(90);
  _log.write("second\nwith two lines");
  EXPECT_EQ(files(), Names{kFirst});
  EXPECT_EQ(read(kFirst),
            "(2026-11-24 20:31:29 +0000) first\n(2026-11-24 20:32:59 +0000) second\nwith two lines\n");
  const std::string created = path(kFirst) + " (" + logDate(birth(_logs / kFirst)) + ")";
  EXPECT_EQ(_lines.lines(),
            (Lines{{6, "writeToLogFile: Creating veskreportingd log directory at " + _logs.string()},
                   {6, "writeToLogFile: Created new veskreportingd log file " + created},
                   {6, "writeToLogFile: Saved log message to " + path(kFirst)},
                   {6, "writeToLogFile: Saved log message to " + path(kFirst)}}));
  EXPECT_EQ(fs::status(_logs).permissions(), fs::perms(0750) & ~fs::perms(0022));
  EXPECT_EQ(fs::status(_logs / kFirst).permissions(), fs::perms(0640) & ~fs::perms(0022));
}

TEST_F(MessageLogTest, ReplacesAFileOlderThanADay) {
  const std::string old = "veskreportingd_whatever_messageLog.diag";
  for (bool staysOpen : {false, true}) {
    fs::remove_all(_logs);
    make(old);
    const WallTime created = birth(_logs / old);
    setAge(staysOpen ? hours(1) : hours(-1));
    _clock.time = created + seconds(86'400);
    _log.write("on the edge");
    EXPECT_EQ(isOpen(old), staysOpen);
    EXPECT_EQ(files(), Names{old});
    EXPECT_EQ(read(old), "before\n(" + logDate(_clock.time) + ") on the edge\n");
    _clock.time += microseconds(1);
    _lines.clear();
    _log.write("beyond it");
    const auto second = std::chrono::floor<seconds>(_clock.time).time_since_epoch().count();
    EXPECT_EQ(files(), Names{"veskreportingd_" + std::to_string(second) + "_messageLog.diag"});
    EXPECT_EQ(_lines.lines().at(0), std::make_pair(6, deleted(old, logDate(created))));
  }
}

TEST_F(MessageLogTest, TouchesNothingElse) {
  const Names others = {"veskreportingd_messageLog.diag",
                        "veskreportingd_1_2_messageLog.diag",
                        "x_1_messageLog.diag",
                        "veskreportingd",
                        "veskreportingd_1_messageLog.txt",
                        "veskreportingd_1_messageLog.diag_",
                        "xveskreportingd_1_messageLog.diag"};
  for (const auto& name : others) make(name);
  fs::create_directory(_logs / "veskreportingd_1_messageLog.diag");
  for (int i = 0; i < 2; ++i) _log.write("message");
  for (const auto& name : others) EXPECT_EQ(read(name), "before\n");
  EXPECT_TRUE(fs::is_directory(_logs / "veskreportingd_1_messageLog.diag")) << "no file of the log's";
  EXPECT_EQ(files().size(), others.size() + 2);
  EXPECT_EQ(_lines.countContaining(6, "Deleted"), 0);
  EXPECT_EQ(_lines.count(6, "writeToLogFile: Saved log message to " + path(kFirst)), 2);
}

TEST_F(MessageLogTest, SeesWhatHappensToItsFileBetweenTwoLines) {
  const std::string other = "veskreportingd_2_messageLog.diag";
  const std::string one = "before\n(2026-11-24 20:31:29 +0000) one\n";
  struct Case {
    std::function<void()> happens;
    std::string file;   // which receives the next line
    std::string start;  // beginning of that file
  };
  const Case cases[] = {
      {[] {}, kFirst, one},
      {[&] { fs::remove(_logs / kFirst); }, kFirst, ""},
      {[&] { fs::rename(_root.write("new", "new\n"), _logs / kFirst); }, kFirst, "new\n"},
      {[&] { makeYounger(other, kFirst); }, other, "before\n"},
      {[&] { fs::remove_all(_logs); }, kFirst, ""},
      {[&] { writeWithoutRoom(_log); }, kFirst, ""},
  };
  int number = 0;
  for (const auto& test : cases) {
    for (bool staysOpen : {true, false}) {
      SCOPED_TRACE(number++);
      fs::remove_all(_logs);
      make(kFirst);
      setAge(staysOpen ? hours(1) : hours(-1));
      _log.write("one");
      EXPECT_EQ(isOpen(kFirst), staysOpen);
      test.happens();
      _log.write("two");
      EXPECT_EQ(files(), Names{test.file});
      EXPECT_EQ(read(test.file), test.start + "(2026-11-24 20:31:29 +0000) two\n");
    }
  }
  EXPECT_EQ(lost(), 2u) << "without room";
}

TEST_F(MessageLogTest, EveryLineThatIsLostIsCountedAndSaidWhy) {
  const std::string failed = "writeToLogFile: Failed to create new veskreportingd log file ";
  const std::string notHere = _root.write("file", "untouched").string();
  struct Case {
    std::string directory;
    std::function<void()> prepare;
    Lines lines;  // empty: the file is deleted
  };
  const Case cases[] = {
      {notHere,
       [] {},
       {{3, "writeToLogFile: Error reading from log directory: Not a directory"},
        {3, failed + notHere + "/" + kFirst}}},
      {"/proc/vesk/logs",
       [] {},
       {{6, "writeToLogFile: Creating veskreportingd log directory at /proc/vesk/logs"},
        {3, failed + "/proc/vesk/logs/" + kFirst}}},
      {_logs, [&] { fs::create_directories(_logs / kFirst); }, {{3, failed + path(kFirst)}}},
      {_logs, [&] { fs::create_symlink(notHere, _logs / kFirst); }, {}},
      {_logs, [&] { ::mkfifo(path(kFirst).c_str(), 0600); }, {}},
      {_logs, [&] { make(kFirst); }, {}},
  };
  std::uint64_t count = 0;
  for (const auto& test : cases) {
    SCOPED_TRACE(++count);
    fs::remove_all(_logs);
    fs::create_directory(_logs);
    test.prepare();
    Lines lines = test.lines;
    if (lines.empty()) lines = {{6, deleted(kFirst, logDate(birth(_logs / kFirst)))}};
    _lines.clear();
    MessageLog log(test.directory, _clock, {.counters = &_counters});
    writeWithoutRoom(log);
    EXPECT_EQ(_lines.lines(), lines);
    EXPECT_EQ(lost(), count);
    EXPECT_TRUE(!test.lines.empty() || files().empty());
  }
  EXPECT_EQ(_root.read("file"), "untouched");
}

TEST_F(MessageLogTest, AFileThatIsFullTakesNoMore) {
  MessageLog log(_logs.string(), _clock, {.maximumBytes = 98, .counters = &_counters});
  for (int i = 0; i < 4; ++i) log.write("a line of 20 letters");
  EXPECT_EQ(read(kFirst).size(), 98u);
  EXPECT_EQ(lost(), 2u);
  EXPECT_EQ(
      _lines.count(4, "writeToLogFile: No room in " + path(kFirst) + " until it expires; lines are lost"), 1);
  EXPECT_EQ(_lines.countContaining(6, "Saved"), 2);
}

TEST(LogFormat, ShowsEveryValueByItsOwnType) {
  struct Case {
    const char* format;
    std::vector<LogArgument> arguments;
    std::string shown;
  };
  const std::string blanks(255, ' ');
  const std::vector<LogArgument> x{"x"};
  const Case cases[] = {
      {"[%@ -> %@] %@", {"a", std::string_view("b"), std::optional<std::string>()}, "[a -> b] (null)"},
      {"%@ %@ %@ %@", {1, UINT64_MAX, -2.5, true}, "1 18446744073709551615 -2.5 1"},
      {"%s %@ %@ %@",
       {5, INT64_MIN, 0.1, static_cast<const char*>(nullptr)},
       "5 -9223372036854775808 0.1 (null)"},
      {"%d %5d|%-5d|%05d|%+d|% d %i", {-1, 2, 3, 4, 5, 6, 7}, "-1     2|3    |00004|+5| 6 7"},
      {"%llu %ld %hhd %qd %jd %zd %td",
       {UINT64_MAX, -1L, 300, 1, 2, 3, 4},
       "18446744073709551615 -1 300 1 2 3 4"},
      {"%.2f %g %f %F %e %E %G",
       {1.005, 0.5, 3, 2u, 1.0, 2, 1e-9},
       "1.00 0.5 3.000000 2.000000 1.000000e+00 2.000000E+00 1E-09"},
      {"100%% %@%%", x, "100% x%"},
      // A placeholder of the wrong type still prints the value, and missing arguments are never read.
      {"%d %f %x", {"text", "text", "text"}, "text text text"},
      {"%d %u %x %d", {1.5, -1, -1, UINT64_MAX}, "1.5 -1 ffffffffffffffff 18446744073709551615"},
      {"%@ %@ %5d|", {"one"}, "one %@ %5d|"},
      {"%@", {"%@ %s %n"}, "%@ %s %n"},
      {"%999999999999d", {1}, blanks + "1"},
      {"%.99999f", {0.0}, "0." + std::string(256, '0')},
  };
  for (const auto& test : cases) EXPECT_EQ(formatLogMessage(test.format, test.arguments), test.shown);
  for (const char* none : {"%", "%5", "%5.", "%-", "%l", "%n %p %*d"})
    EXPECT_EQ(formatLogMessage(none, x), none);
  EXPECT_EQ(formatLogMessage("%.256f", std::vector<LogArgument>{1e300}).size(), 558u);
}

TEST(WriteToLogFile, FormatsALineOfTheProcessSLog) {
  writeToLogFile("[%@ -> flushMessages] %@ %d", "httpPost", std::string("posted"), 5);
  writeToLogFile("100%%");
  const std::string text = testRoot().readAll("var/mobile/Library/Logs/Dunmore/Retired");
  const std::string start = ") [httpPost -> flushMessages] posted 5\n(";
  EXPECT_EQ(text.find(start), text.find(')')) << text;
  EXPECT_EQ(text.substr(text.rfind(')')), ") 100%\n");
}

}  // namespace
}  // namespace vesk::test
