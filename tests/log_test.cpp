// The rate limit of the system log.
#include <gtest/gtest.h>

#include <future>

#include "platform/log/LogRateLimit.h"
#include "platform/log/LogUser.h"
#include "platform/queue/QueueThread.h"
#include "tests/support/CapturedLog.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;

class RateLimit : public testing::Test {
 protected:
  /// How many of `lines` lines may be written.
  int written(const char& site, std::uint32_t user, int lines) {
    int count = 0;
    for (int i = 0; i < lines; ++i) {
      auto verdict = limit.admit(&site, user, LogLevel::Warning, "format", now);
      count += verdict.mayWrite ? 1 : 0;
      leftOut.insert(leftOut.end(), verdict.leftOut.begin(), verdict.leftOut.end());
    }
    return count;
  }

  LogRateLimit limit{3};
  LogRateLimit::Time now{1h};
  std::vector<LogRateLimit::LeftOut> leftOut;
  const char sites[3] = {};
};

TEST_F(RateLimit, CountsEachSiteAndUserByItselfAndTellsWhatItLeftOutOnce) {
  EXPECT_EQ(written(sites[0], 1, 10), 3);
  EXPECT_EQ(written(sites[0], 2, 2), 2);
  EXPECT_EQ(written(sites[1], 1, 5), 3);
  now += 10s - 1ns;
  EXPECT_EQ(written(sites[0], 1, 1), 0);
  EXPECT_TRUE(leftOut.empty());
  now += 1ns;
  EXPECT_EQ(written(sites[2], 3, 1), 1) << "any line brings the news";
  using LeftOut = LogRateLimit::LeftOut;
  EXPECT_EQ(leftOut,
            (std::vector<LeftOut>{{LogLevel::Warning, 1, "format", 8}, {LogLevel::Warning, 1, "format", 2}}));
}

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
