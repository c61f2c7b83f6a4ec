// A serial queue together with its time: what a service runs on whose policy depends on when things happen.
#pragma once

#include <chrono>
#include <memory>

#include "platform/files/FileDescriptor.h"
#include "platform/queue/WorkQueue.h"

namespace vesk {

/// Runs work one at a time, in order, and calls handlers at times and when descriptors are readable; its own
/// clock says when. A WorkQueue in the daemon; a test may stand in for the clock and turn it by hand.
/// Thread-safe.
class TimedQueue {
 public:
  using Clock = std::chrono::steady_clock;

  /// Calls its handler until it is destroyed. Destroyed on the queue, the handler is not called any more;
  /// elsewhere, a call that has begun may still go on. What the handler captured goes with it.
  class Source {
   public:
    virtual ~Source() = default;
  };

  virtual ~TimedQueue() = default;
  virtual Clock::time_point now() const = 0;
  virtual void submit(Work work) = 0;
  /// Once, not before `delay` is over. Can't be taken back.
  virtual void submitAfter(std::chrono::milliseconds delay, Work work) = 0;
  /// Fires after `first`, then every `interval`, which is more than zero.
  virtual std::unique_ptr<Source> makeTimer(std::chrono::milliseconds first,
                                            std::chrono::milliseconds interval, Work handler) = 0;
  /// As ReadSource.
  virtual std::unique_ptr<Source> makeReadSource(std::shared_ptr<const FileDescriptor> descriptor,
                                                 Work handler) = 0;
};

/// Hands out queues.
class TimedQueueMaker {
 public:
  virtual ~TimedQueueMaker() = default;
  /// `label` names the queue in log lines; a literal. May throw when there is nothing to run it on.
  virtual std::shared_ptr<TimedQueue> makeQueue(const char* label) = 0;
};

}  // namespace vesk
