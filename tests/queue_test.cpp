// Serial queues and timers, on real threads.
#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <optional>
#include <stdexcept>

#include "platform/queue/WorkQueue.h"
#include "tests/support/CapturedLog.h"

namespace vesk {
namespace {

using std::chrono::milliseconds;

class Queues : public testing::Test {
 protected:
  /// Waits until everything submitted to the queue before has run.
  static void drain(WorkQueue& queue) {
    std::promise<void> done;
    queue.submit([&done] { done.set_value(); });
    done.get_future().wait();
  }

  WorkQueuePool pool{3};
  WorkQueue queue{pool};
  std::promise<void> done;
};
using WorkTimerTest = Queues;

TEST_F(Queues, RunsItsWorkOneAtATimeInOrder) {
  std::vector<int> order;  // guarded by the queue itself
  std::atomic<int> inside{0};
  for (int i = 0; i < 500; ++i) {
    queue.submit([&, i] {
      EXPECT_EQ(inside.fetch_add(1), 0);
      order.push_back(i);
      inside.fetch_sub(1);
    });
  }
  drain(queue);
  ASSERT_EQ(order.size(), 500u);
  EXPECT_TRUE(std::is_sorted(order.begin(), order.end()));
}

TEST_F(Queues, GoOnAfterWorkThatThrows) {
  test::CapturedLog log;
  queue.submit([] { throw std::runtime_error("broken"); });
  queue.submit([] { throw 7; });
  drain(queue);
  EXPECT_EQ(log.countContaining(3, ""), 2);
}

TEST_F(WorkTimerTest, RepeatsUntilItCancelsItself) {
  int fired = 0;
  WorkTimer timer;
  queue.submit([&] {
    timer = WorkTimer(queue, milliseconds(0), milliseconds(1), [&] {
      if (++fired < 3) return;
      timer.cancel();
      timer.cancel();
      done.set_value();
    });
  });
  done.get_future().wait();
  std::promise<void> later;
  queue.submitAfter(milliseconds(20), [&] { later.set_value(); });
  later.get_future().wait();
  EXPECT_EQ(fired, 3);
}

TEST(WorkQueuePool, StopDestroysWhatHasNotRun) {
  auto token = std::make_shared<int>(1);
  std::optional<WorkQueuePool> pool(std::in_place, 1);
  WorkQueue queue(*pool);
  WorkTimer timer(queue, std::chrono::hours(1), milliseconds(0), [token, queue] {});
  queue.submitAfter(std::chrono::hours(1), [token, queue] {});
  pool->stop();
  pool.reset();
  queue.submit([token] { ADD_FAILURE(); });
  WorkTimer late(queue, milliseconds(0), milliseconds(1), [token] { ADD_FAILURE(); });
  EXPECT_EQ(token.use_count(), 1);
}

}  // namespace
}  // namespace vesk
