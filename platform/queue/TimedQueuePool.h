// The queues of the machine's own clock.
#pragma once

#include <chrono>
#include <cstddef>
#include <memory>

#include "platform/queue/TimedQueue.h"

namespace vesk {

/// Makes queues that share a few threads, and knows how many of them are still in use. Thread-safe.
class TimedQueuePool final : public TimedQueueMaker {
 public:
  /// Throws std::system_error when the threads can't be started.
  explicit TimedQueuePool(std::size_t threads);
  /// As `stop`.
  ~TimedQueuePool() override;
  TimedQueuePool(const TimedQueuePool&) = delete;
  TimedQueuePool& operator=(const TimedQueuePool&) = delete;

  std::shared_ptr<TimedQueue> makeQueue(const char* label) override;

  /// Waits until every queue has been let go of, at most `timeout`; true when none was left. Not from a
  /// thread of the pool.
  [[nodiscard]] bool waitUntilUnused(std::chrono::milliseconds timeout);

  /// As WorkQueuePool::stop: what waits is destroyed without having run, and queues do nothing any more.
  void stop();

 private:
  class Queue;
  struct Users;
  const std::shared_ptr<Users> _users;
  WorkQueuePool _pool;
};

}  // namespace vesk
