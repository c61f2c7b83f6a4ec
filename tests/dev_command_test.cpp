// `veskreport dev`, with the real collector and daemon.
#include <gtest/gtest.h>
#include <signal.h>

#include <cstdlib>

#include "tests/support/TempDirectory.h"
#include "tests/support/Veskreport.h"

namespace vesk::test {
namespace {

constexpr char kTool[] = VESK_BIN_DIRECTORY "/veskreport";

class DevCommand : public testing::Test {
 protected:
  ChildProcess::Options dev(std::vector<std::string> arguments, const std::string& tool = kTool) const {
    arguments.insert(arguments.begin(), {tool, "dev"});
    // LeakSanitizer needs tracing, which the daemon's sandbox forbids.
    const char* asan = std::getenv("ASAN_OPTIONS");
    return {.command = std::move(arguments),
            .environment = {{"TMPDIR", temporary.path()},
                            {"ASAN_OPTIONS", std::string(asan ? asan : "") + ":detect_leaks=0"}}};
  }
  ToolOutcome run(const ChildProcess::Options& options) const {
    ChildProcess process(options);
    return {process.wait().value_or(-1), process.output(), process.errors()};
  }
  /// Runs it with a program: `script`, in which "report" is the tool.
  ToolOutcome runScript(const std::string& script, std::vector<std::string> arguments = {}) const {
    arguments.insert(arguments.end(),
                     {"--", "/bin/sh", "-c", "report() { " + std::string(kTool) + " \"$@\"; }; " + script});
    return run(dev(std::move(arguments)));
  }
  bool leavesNothing() const { return std::filesystem::is_empty(temporary.path()); }

  TempDirectory temporary;
};

TEST_F(DevCommand, ShowsWhatAProgramReportsAndEndsWithItsStatus) {
  const auto told = runScript(
      "report send --client-type 5 --client-name Camera -c 3 -t 1 frames:=240 lens=wide &&"
      "report send --client-type 10 --service-name Sync -c 4 -t 2 --no-wait && exit 7");
  EXPECT_EQ(told.status, 7) << told.errors;
  EXPECT_TRUE(told.says(" event 0/0 Camera, a session starts\n")) << told.output;
  EXPECT_TRUE(told.says(" event 3/1 Camera frames=240 lens=wide\n")) << told.output;
  EXPECT_TRUE(told.says(" event 4/2 Sync\n")) << told.output;
  EXPECT_TRUE(leavesNothing());
}

TEST_F(DevCommand, ShowsWhyAMessageIsNotReported) {
  const auto told = runScript(
      "report consent withdraw; report send --client-type 6 --client-name Camera -c 3 -t 1;"
      "report send --client-type 3 --client-name Camera -c 3 -t 1");
  EXPECT_EQ(told.status, 1);
  EXPECT_TRUE(told.says("httpPost: message 3/1 of 1 dropped, state-disabled (the user did not agree"))
      << told.output;
  EXPECT_TRUE(told.says("no storebag is for client type 3\n")) << told.errors;
}

TEST_F(DevCommand, EndsInOrderAtASignal) {
  for (int number : {SIGINT, SIGTERM}) {
    ChildProcess process(dev({}));
    ASSERT_TRUE(process.waitForText("Ctrl-C ends it")) << process.errors();
    const std::string variable = "export VESKREPORTINGD_ROOT=", line = process.output();
    ASSERT_TRUE(line.starts_with(variable)) << line;
    const std::string root = line.substr(variable.size(), line.find('\n') - variable.size());
    const auto sent = veskreport(
        {"send", "--root", root, "--client-type", "7", "--client-name", "Modem", "-c", "3", "-t", "1"});
    EXPECT_EQ(sent.status, 0) << sent.errors;
    EXPECT_TRUE(process.waitForText(" event 3/1 Modem\n")) << process.output();
    process.signal(number);
    EXPECT_EQ(process.wait(), 0);
    EXPECT_TRUE(leavesNothing());
  }
}

TEST_F(DevCommand, TheDaemonEndsWithIt) {
  ChildProcess process(dev({"--directory", temporary / "kept"}));
  ASSERT_TRUE(process.waitForText("Ctrl-C ends it")) << process.errors();
  EXPECT_EQ(veskreport({"status", "--root", temporary / "kept"}).status, 0);
  process.signal(SIGKILL);
  EXPECT_EQ(process.wait(), 128 + SIGKILL);
  EXPECT_TRUE(eventually([&] {
    return veskreport({"status", "--root", temporary / "kept"}).says("is veskreportingd running?");
  }));
}

TEST_F(DevCommand, SaysWhichServerHasEnded) {
  const auto killed = runScript(
      "kill -9 $(sed -n 's/.*\"pid\": *\\([0-9]*\\).*/\\1/p' "
      "$VESKREPORTINGD_ROOT/collector/ready.json); exec tail -f /dev/null");
  EXPECT_EQ(killed.status, 1);
  EXPECT_TRUE(killed.says("veskcollector has ended with status 137")) << killed.errors;
  const auto told = runScript("report reload; exec tail -f /dev/null");
  EXPECT_EQ(told.status, 1);
  EXPECT_TRUE(told.says("veskreportingd has ended with status 0\n")) << told.errors;
  EXPECT_TRUE(told.says("No service manager starts the daemon anew.\n")) << told.errors;
  EXPECT_TRUE(leavesNothing());
}

TEST_F(DevCommand, KeepsADirectoryOfItsOwn) {
  for (const char* number : {"1", "2"}) {
    const auto told =
        runScript("report send --client-type 9 --client-name Board -c 3 -t 1 n:=" + std::string(number),
                  {"--directory", temporary / "kept"});
    EXPECT_EQ(told.status, 0) << told.errors;
    EXPECT_TRUE(told.says(" event 3/1 Board n=" + std::string(number))) << told.output;
  }
  EXPECT_NE(temporary.read("kept/collector/events.jsonl").find("\"n\":1"), std::string::npos);
  const auto refused = run(dev({"--directory", temporary.path()}));
  EXPECT_EQ(refused.status, 1);
  EXPECT_TRUE(refused.says("is neither empty nor the directory of an earlier run")) << refused.errors;
}

TEST_F(DevCommand, NamesWhatIsMissing) {
  EXPECT_EQ(run(dev({"--", "/nonexistent"})).status, 127);
  EXPECT_EQ(runScript("kill -TERM $$; exit 3").status, 128 + SIGTERM);  // signals are as usual in the program
  EXPECT_TRUE(leavesNothing());
  std::filesystem::copy_file(kTool, temporary / "veskreport");
  auto alone = dev({}, temporary / "veskreport");
  alone.environment["PATH"] = "/nonexistent";
  const auto told = run(alone);
  EXPECT_EQ(told.status, 1);
  EXPECT_TRUE(told.says("install the package veskcollector\n")) << told.errors;
}

}  // namespace
}  // namespace vesk::test
