// What an operator does to the real daemon: outbox, consent, a new start.
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <set>
#include <sstream>

#include "tests/support/OperatorTest.h"

namespace vesk::test {
namespace {

class Operations : public OperatorTest {
 protected:
  /// Sends messages that the collector is not there for, and waits until they are put aside.
  void putAside(int messages) {
    auto client = session("Camera");  // which fetches the storebag
    harness.stopCollector();
    for (int i = 0; i < messages; ++i)
      EXPECT_TRUE(client.reporting.sendMessageAndWait(message(3, {{"number", i}}, 1)));
    ASSERT_TRUE(eventually([&] { return waiting() >= messages; }));
  }
  std::int64_t waiting() {
    const auto told = ask({"outbox", "--json"});
    const auto outbox = boost::json::parse(told.text).as_object();
    return outbox.contains("posts") ? outbox.at("posts").as_int64() : 0;
  }
};

TEST_F(Operations, TheOutboxIsHeldAndReleased) {
  start(kReports);
  EXPECT_EQ(ask({"outbox", "hold"}).status, 0);
  putAside(2);
  EXPECT_TRUE(contains(ask({"status"}).text, "an operator holds the outbox"));
  EXPECT_EQ(harness.stopDaemon(), 0);
  harness.startCollector();
  harness.startDaemon();
  { session("Camera"); }  // is posted at once, which shows that the server is there
  harness.waitForEventsOfMethod(0, 1);
  EXPECT_TRUE(contains(ask({"outbox", "show"}).text, "held: nothing of it is sent"));
  EXPECT_GE(waiting(), 2) << "a new start does not end it";
  EXPECT_EQ(ask({"outbox", "release"}).status, 0);
  EXPECT_EQ(harness.waitForEventsOfMethod(3, 2).size(), 2u);
}

TEST_F(Operations, TheOutboxIsExported) {
  start(kReports);
  putAside(70);  // more than one answer carries
  const std::string file = (harness.root.path() / "export.jsonl").string();
  EXPECT_EQ(ask({"outbox", "export", "/nonexistent/export"}).status, 1);
  const auto told = ask({"outbox", "export", file});
  EXPECT_EQ(told.status, 0) << told.text;
  std::set<std::int64_t> numbers;
  std::istringstream lines(harness.root.read("export.jsonl"));
  for (std::string line; std::getline(lines, line);) {
    const auto post = boost::json::parse(line).as_object();
    EXPECT_TRUE(std::string(post.at("url").as_string()).starts_with("https://"));
    for (const auto& event : post.at("body").at("events").as_array()) {
      if (event.at("_method") == 3) numbers.insert(event.at("number").as_int64());
    }
  }
  EXPECT_EQ(numbers.size(), 70u);
  EXPECT_EQ(waiting(), 0);
  EXPECT_TRUE(contains(ask({"drops"}).text, "delayed since the start: ")) << ask({"drops"}).text;
  harness.startCollector();
  { session("Camera"); }
  for (const auto& each : harness.waitForEventsOfMethod(0, 1)) EXPECT_NE(each.at("event").at("_method"), 3);
}

TEST_F(Operations, AWithdrawalDeletesWhatWaitsAndEndsSessions) {
  start(kReports);
  EXPECT_TRUE(contains(ask({"consent"}).text, "granted (diagnosticsSubmission in "));
  const auto identifiers = harness.root.read("var/lib/veskreportingd/identifiers.toml");
  putAside(2);
  auto client = session("Camera");
  const auto told = ask({"consent", "withdraw"});
  EXPECT_EQ(told.status, 0) << told.text;
  EXPECT_TRUE(contains(told.text, "withdrawn; ")) << told.text;
  EXPECT_EQ(waiting(), 0);
  EXPECT_TRUE(contains(ask({"drops"}).text, "httpPost consent-withdrawn"));
  EXPECT_NE(harness.root.read("var/lib/veskreportingd/identifiers.toml"), identifiers);
  harness.startCollector();
  ASSERT_TRUE(eventually([&] { return contains(ask({"status"}).text, "the user did not agree"); }))
      << "the session has started again, without consent";
  EXPECT_TRUE(contains(ask({"consent", "show"}).text, "not granted"));
  EXPECT_EQ(ask({"consent", "grant"}).status, 0);
  ASSERT_TRUE(eventually([&] { return contains(ask({"status"}).text, "httpPost: enabled"); }));
  EXPECT_TRUE(client.reporting.sendMessageAndWait(message(4)));
  harness.waitForEventsOfMethod(4, 1);
  for (const auto& each : harness.waitForEventsOfMethod(0, 1)) EXPECT_NE(each.at("event").at("_method"), 3);
}

TEST_F(Operations, AReloadEndsTheDaemonInOrder) {
  for (bool bySignal : {false, true}) {
    start(kReports);
    if (bySignal) {
      harness.daemon().signal(SIGHUP);
    } else {
      EXPECT_EQ(ask({"reload"}).status, 0);
    }
    EXPECT_EQ(harness.daemon().wait(), 0);
    EXPECT_TRUE(
        contains(harness.daemon().errors(), "main: Ending. No service manager starts the daemon anew."));
  }
}

TEST_F(Operations, CountsSurviveANewStart) {
  start(kReports);
  EXPECT_TRUE(session("Nobody").reporting.sendMessageAndWait(message(3)));
  EXPECT_EQ(harness.stopDaemon(), 0);
  harness.startDaemon();
  const auto told = ask({"drops"}).text;
  EXPECT_TRUE(contains(told, "lost since the installation: 2 httpPost state-disabled\n")) << told;
  EXPECT_FALSE(contains(told, "since the start")) << told;
}

TEST_F(Operations, OthersMayLookButNotTouch) {
  start(kReports);
  if (::geteuid() != 0) GTEST_SKIP() << "needs the right to become another user";
  const auto camera = session("Camera");
  const std::string root = harness.root.path().string();
  ASSERT_EQ(::chmod(root.c_str(), 0755), 0);
  // Others may not reach the build directory.
  std::filesystem::copy_file(VESK_BIN_DIRECTORY "/veskreport", harness.root / "veskreport");
  for (const auto& [command, status] :
       {std::pair("status", 0), std::pair("reload", 1), std::pair("outbox hold", 1)}) {
    ChildProcess tool({"/usr/bin/setpriv", "--reuid=65534", "--regid=65534", "--clear-groups", "/bin/sh",
                       "-c", root + "/veskreport " + command + " --root " + root});
    EXPECT_EQ(tool.wait(), status) << tool.errors();
    EXPECT_FALSE(contains(tool.output(), "storebag") || contains(tool.output(), "session")) << tool.output();
    EXPECT_EQ(contains(tool.errors(), "Only root, the daemon's user and the group"), status == 1)
        << tool.errors();
  }
}

}  // namespace
}  // namespace vesk::test
