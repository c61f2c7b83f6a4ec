// A serial queue together with its time: what a service runs on whose policy depends on when things happen.
#pragma once

#include <chrono>
#include <functional>
#include <memory>

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// Runs on a queue; must not block for long. What it throws is logged.
using Work = std::function<void()>;

/// Runs work one at a time, in order, and calls handlers at times and when descriptors are readable; its own
/// clock says when. QueueThread makes those of the daemon; a test may stand in for the clock and turn it by
/// hand. Thread-safe.
class TimedQueue {
 public:
  using Clock = std::chrono::steady_clock;

  /// Calls its handler until it is destroyed. Destroyed on the queue, the handler is not called any more;
  /// elsewhere, the handler may be called until the queue gets to know of it. What the handler captured goes
  /// with it.
  class Source {
   public:
    virtual ~Source() = default;
  };

  virtual ~TimedQueue() = default;
  virtual Clock::time_point now() const = 0;
  virtual void submit(Work work) = 0;
  /// Once, not before `delay` is over. Can't be taken back.
  virtual void submitAfter(std::chrono::milliseconds delay, Work work) = 0;
  /// Fires after `first`, then every `interval`, which is more than zero. Firings that were missed are not
  /// made up for.
  virtual std::unique_ptr<Source> makeTimer(std::chrono::milliseconds first,
                                            std::chrono::milliseconds interval, Work handler) = 0;
  /// Calls its handler whenever the descriptor has something to read, and again while anything is left. Keeps
  /// its share of the descriptor until it has stopped watching. Throws std::system_error for a descriptor
  /// that can't be watched.
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
