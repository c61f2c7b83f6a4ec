// The rate limit of the system log.
#include <gtest/gtest.h>

#include <future>

#include "platform/log/LogUser.h"
#include "platform/queue/QueueThread.h"
#include "tests/support/CapturedLog.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;

TEST(SystemLog, LimitsAllButErrorsForEachUserOnWhoseBehalfAThreadWorks) {
  CapturedLog log;
  auto flood = [](const char* who) {
    for (int i = 0; i < 5; ++i) {
      VESK_LOG_ERROR("error %s", who);
      VESK_LOG_WARNING("warning %s", who);
      VESK_LOG_INFO("info %s", who);
      VESK_LOG_DEBUG("debug %s", who);
    }
  };
  SystemLog::setRateLimit(2);
  flood("daemon");
  {
    LogUser user(7);
    flood("client");
    QueueThread thread;
    auto queue = thread.makeQueue("queue");
    std::promise<void> done;
    queue->submit([&] { flood("queue"); });
    queue->submitAfter(0ms, [&] {
      flood("timer");
      done.set_value();
    });
    done.get_future().wait();
  }
  flood("daemon");
  SystemLog::close();
  SystemLog::setRateLimit(0);
  flood("free");
  for (int level : {4, 6, 7}) {
    EXPECT_EQ(log.countContaining(level, "daemon"), 2);
    EXPECT_EQ(log.countContaining(level, "client"), 2);
    EXPECT_EQ(log.countContaining(level, "queue") + log.countContaining(level, "timer"), 0);
    EXPECT_EQ(log.countContaining(level, "free"), 5);
  }
  EXPECT_EQ(log.countContaining(3, ""), 6 * 5);
  EXPECT_EQ(log.count(4, "log: Left out 8 lines like: warning %s"), 1);
  EXPECT_EQ(log.count(6, "log: Left out 13 lines of user 7 like: info %s"), 1);
}

}  // namespace
}  // namespace vesk::test
