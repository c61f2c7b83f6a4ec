// Serial queues and timers, on their real thread.
#include <gtest/gtest.h>

#include <unistd.h>

#include <algorithm>
#include <array>
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

TEST_F(Queues, SourcesLetGoOfTheirDescriptorWhenDestroyedElsewhere) {
  std::array<int, 2> ends{};
  ASSERT_EQ(::pipe(ends.data()), 0);
  FileDescriptor writer(ends[1]);
  auto reader = std::make_shared<const FileDescriptor>(ends[0]);
  std::promise<void> read;
  auto source = queue->makeReadSource(reader, [&] {
    char byte;
    EXPECT_EQ(::read(reader->get(), &byte, 1), 1);
    read.set_value();
  });
  ASSERT_EQ(::write(writer.get(), "x", 1), 1);
  read.get_future().wait();
  source.reset();
  drain();
  EXPECT_EQ(reader.use_count(), 1);
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
