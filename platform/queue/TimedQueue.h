// A serial queue with its own clock, for services whose policy depends on time.
#pragma once

#include <chrono>
#include <functional>
#include <memory>

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// Runs on a queue; must not block for long. What it throws is logged.
using Work = std::function<void()>;

/// Runs work one at a time, in order, and calls handlers at times given by its own clock and when descriptors
/// are readable. The daemon's queues are made by QueueThread; a test may replace the clock and advance it by
/// hand. Thread-safe.
class TimedQueue {
 public:
  using Clock = std::chrono::steady_clock;

  /// Calls its handler until destroyed. If destroyed on the queue, the handler is not called again; otherwise
  /// it may still be called until the queue learns of it. The handler's captures are destroyed with it.
  class Source {
   public:
    virtual ~Source() = default;
  };

  virtual ~TimedQueue() = default;
  virtual Clock::time_point now() const = 0;
  virtual void submit(Work work) = 0;
  /// Runs `work` once, not before `delay` has passed. Can't be cancelled.
  virtual void submitAfter(std::chrono::milliseconds delay, Work work) = 0;
  /// Fires after `first`, then every `interval`, which must be positive. Missed firings are not made up for.
  virtual std::unique_ptr<Source> makeTimer(std::chrono::milliseconds first,
                                            std::chrono::milliseconds interval, Work handler) = 0;
  /// Calls its handler whenever the descriptor is readable, and again while data is left. Keeps its share of
  /// the descriptor until it has stopped watching. Throws std::system_error if the descriptor can't be
  /// watched.
  virtual std::unique_ptr<Source> makeReadSource(std::shared_ptr<const FileDescriptor> descriptor,
                                                 Work handler) = 0;
};

/// Makes queues.
class TimedQueueMaker {
 public:
  virtual ~TimedQueueMaker() = default;
  /// `label`, a literal, names the queue in log lines. May throw if there is no thread to run the queue.
  virtual std::shared_ptr<TimedQueue> makeQueue(const char* label) = 0;
};

}  // namespace vesk
