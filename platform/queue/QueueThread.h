// Queues that run on the system's clock.
#pragma once

#include <chrono>
#include <memory>

#include "platform/queue/TimedQueue.h"

namespace vesk {

/// Makes queues that share one thread, started with the first queue, and counts those in use. Thread-safe.
class QueueThread final : public TimedQueueMaker {
 public:
  QueueThread();
  /// Calls `stop`.
  ~QueueThread() override;
  QueueThread(const QueueThread&) = delete;
  QueueThread& operator=(const QueueThread&) = delete;

  /// Throws std::system_error when the thread can't be started.
  std::shared_ptr<TimedQueue> makeQueue(const char* label) override;

  /// Waits up to `timeout` until every queue has been released. Returns true if none is left. Must not be
  /// called on a queue.
  [[nodiscard]] bool waitUntilUnused(std::chrono::milliseconds timeout);

  /// Waits for the running work, then ends the thread. Pending work, and work submitted later, is destroyed
  /// without being run. Queues and sources may outlive the thread and then do nothing. May be called twice.
  /// Must not be called on a queue.
  void stop();

 private:
  class Loop;
  class Queue;
  class Waiter;
  class Timer;
  class Watch;
  struct Shared;
  const std::shared_ptr<Shared> _shared;
};

}  // namespace vesk
