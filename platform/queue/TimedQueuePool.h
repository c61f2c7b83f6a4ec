// The queues of the machine's own clock.
#pragma once

#include <chrono>
#include <cstddef>
#include <memory>
#include <optional>

#include "platform/queue/TimedQueue.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// Makes queues that share a few threads, started with the first queue, and knows how many queues are still
/// in use. Thread-safe.
class TimedQueuePool final : public TimedQueueMaker {
 public:
  explicit TimedQueuePool(std::size_t threads);
  /// As `stop`.
  ~TimedQueuePool() override;
  TimedQueuePool(const TimedQueuePool&) = delete;
  TimedQueuePool& operator=(const TimedQueuePool&) = delete;

  /// Throws std::system_error when the threads can't be started.
  std::shared_ptr<TimedQueue> makeQueue(const char* label) override;

  /// Waits until every queue has been let go of, at most `timeout`; true when none was left. Not from a
  /// thread of the pool.
  [[nodiscard]] bool waitUntilUnused(std::chrono::milliseconds timeout);

  /// As WorkQueuePool::stop: what waits is destroyed without having run, and queues do nothing any more. No
  /// queue may be made afterwards.
  void stop();

 private:
  class Queue;
  struct Users;
  WorkQueuePool& pool();

  const std::size_t _threads;
  const std::shared_ptr<Users> _users;
  Mutex _mutex;
  std::optional<WorkQueuePool> _pool VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
