// Serial queues and timers, on their real thread.
#include <gtest/gtest.h>

#include <future>
#include <optional>
#include <stdexcept>

#include "platform/queue/QueueThread.h"
#include "tests/support/CapturedLog.h"

namespace vesk {
namespace {

using std::chrono::milliseconds;

class Queues : public testing::Test {
 protected:
  /// Waits until everything submitted before has run.
  void drain() {
    std::promise<void> done;
    queue->submit([&done] { done.set_value(); });
    done.get_future().wait();
  }

  QueueThread thread;
  std::shared_ptr<TimedQueue> queue = thread.makeQueue("queue");
};

TEST_F(Queues, GoOnAfterWorkThatThrows) {
  test::CapturedLog log;
  queue->submit([] { throw std::runtime_error("broken"); });
  queue->submit([] { throw 7; });
  drain();
  EXPECT_EQ(log.count(3, "queue: work failed: broken"), 1);
  EXPECT_EQ(log.count(3, "queue: work failed"), 1);
}

TEST(QueueThread, StopDestroysWhatHasNotRun) {
  auto token = std::make_shared<int>(1);
  std::optional<QueueThread> thread(std::in_place);
  auto queue = thread->makeQueue("queue");
  auto timer = queue->makeTimer(std::chrono::hours(1), milliseconds(1), [token, queue] {});
  queue->submitAfter(std::chrono::hours(1), [token, queue] {});
  thread->stop();
  thread.reset();
  queue->submit([token] { ADD_FAILURE(); });
  auto late = queue->makeTimer(milliseconds(0), milliseconds(1), [token] { ADD_FAILURE(); });
  EXPECT_EQ(token.use_count(), 1);
}

}  // namespace
}  // namespace vesk
