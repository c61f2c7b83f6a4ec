// The sandbox of the daemon that really runs. What it allows and denies is tried in sandbox_enter_test.cpp.
#include <gtest/gtest.h>

#include "tests/support/DaemonHarness.h"

namespace vesk::test {
namespace {

TEST(SandboxedDaemon, ConfinesEveryThread) {
  DaemonHarness harness;
  harness.startDaemon();
  RoadClient client(harness);
  EXPECT_TRUE(client.reporting.flushMessagesAndWait());
  int threads = 0;
  const std::string tasks = "/proc/" + std::to_string(harness.daemon().pid()) + "/task";
  for (const auto& task : std::filesystem::directory_iterator(tasks)) {
    std::ifstream file(task.path() / "status");
    const std::string status{std::istreambuf_iterator<char>(file), {}};
    for (const char* line : {"NoNewPrivs:\t1\n", "Seccomp:\t2\n"})
      EXPECT_NE(status.find(line), std::string::npos) << status;
    ++threads;
  }
  EXPECT_GE(threads, 4) << "main, listener, connection, HTTP";
  EXPECT_EQ(harness.stopDaemon(), 0);
}

}  // namespace
}  // namespace vesk::test
