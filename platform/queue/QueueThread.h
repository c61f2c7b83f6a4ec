// The queues of the machine's own clock.
#pragma once

#include <chrono>
#include <memory>

#include "platform/queue/TimedQueue.h"

namespace vesk {

/// Makes queues that share one thread, started with the first queue, and counts the queues that are in use.
/// Thread-safe.
class QueueThread final : public TimedQueueMaker {
 public:
  QueueThread();
  /// As `stop`.
  ~QueueThread() override;
  QueueThread(const QueueThread&) = delete;
  QueueThread& operator=(const QueueThread&) = delete;

  /// Throws std::system_error when the thread can't be started.
  std::shared_ptr<TimedQueue> makeQueue(const char* label) override;

  /// Waits until every queue has been released, at most `timeout`; true when none was left. Not from a queue.
  [[nodiscard]] bool waitUntilUnused(std::chrono::milliseconds timeout);

  /// Waits for the work that is running, then ends the thread. Work that waits is destroyed without having
  /// run, as is work that is submitted later; queues and sources may outlive the thread and do nothing any
  /// more. May be called twice; not from a queue.
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
