// The daemon on a failing machine: disks, descriptors and memory.
#include <gtest/gtest.h>
#include <sys/resource.h>

#include <algorithm>

#include "tests/support/DaemonHarness.h"
#include "tests/support/ProcessFacts.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;

constexpr char kLogs[] = "var/mobile/Library/Logs/Dunmore/Retired";
constexpr char kState[] = "var/lib/veskreportingd";

TEST(Machine, ADiskThatFailsCostsNoMessage) {
  const std::pair<const char*, const char*> cases[] = {
      {kLogs, "writeToLogFile: Error reading from log directory: Not a directory"},
      {kState, "cannot keep identifiers in"}};
  for (const auto& [directory, line] : cases) {
    SCOPED_TRACE(directory);
    DaemonHarness harness;
    std::filesystem::remove_all(harness.root / directory);
    harness.root.write(directory, "a file where a directory should be");
    harness.startDaemon();
    RoadClient client(harness);
    for (int i = 0; i < 5; ++i) {
      auto sent = client.reporting.sendMessageAndWait(message(3));
      ASSERT_TRUE(sent) << sent.detail;
      EXPECT_TRUE(sent.answer) << "the client is told what was posted, the log or no log";
    }
    harness.waitForEventsOfMethod(3, 5);
    EXPECT_TRUE(harness.daemon().waitForText(line));
    EXPECT_EQ(harness.stopDaemon(), 0);
  }
}

void limit(const ChildProcess& process, __rlimit_resource resource, rlim_t to) {
  rlimit before{};
  ASSERT_EQ(::prlimit(process.pid(), resource, nullptr, &before), 0);
  const rlimit after{std::min(to, before.rlim_max), before.rlim_max};
  ASSERT_EQ(::prlimit(process.pid(), resource, &after, nullptr), 0);
}

TEST(Machine, WithoutDescriptorsItGoesOnAndForgetsNothing) {
  if (kIsSanitized) GTEST_SKIP() << "the sanitizer opens pipes to look at memory, and complains without";
  DaemonHarness harness;
  harness.startDaemon();
  RoadClient client(harness);
  limit(harness.daemon(), RLIMIT_NOFILE, 3);
  // Posts, the message log and new clients all fail to get a descriptor.
  harness.stopCollector();
  for (int i = 0; i < 20; ++i) {
    auto sent = client.reporting.sendMessageAndWait(message(3, Dictionary{{"n", i}}));
    ASSERT_TRUE(sent) << sent.detail;
  }
  VeskReporting refused(harness.clientOptions());
  EXPECT_EQ(refused.connect(500ms).status, ReportingStatus::NotConnected);
  harness.startCollector();
  limit(harness.daemon(), RLIMIT_NOFILE, RLIM_INFINITY);
  harness.waitForEventsOfMethod(3, 20);
  EXPECT_TRUE(refused.connect(ChildProcess::kPatience)) << "by itself, once there is room";
  EXPECT_EQ(harness.stopDaemon(), 0);
}

TEST(Machine, WithoutMemoryItSaysSoAndEnds) {
  if (kIsSanitized) GTEST_SKIP() << "the sanitizer has an allocator of its own";
  DaemonHarness harness;
  harness.startDaemon();
  RoadClient client(harness);
  limit(harness.daemon(), RLIMIT_DATA, 1);  // 0 would be no limit
  EXPECT_FALSE(client.reporting.sendMessageAndWait(message(3, {{"text", std::string(900'000, 'x')}})));
  EXPECT_EQ(harness.daemon().wait(), EXIT_FAILURE);
  EXPECT_NE(harness.daemon().errors().find("<3>main: Out of memory, ending\n"), std::string::npos);
}

}  // namespace
}  // namespace vesk::test
