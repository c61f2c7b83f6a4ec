// Serial work queues, timers and read sources over a small pool of threads.
#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// Runs on a thread of the pool; must not block for long. What it throws is logged.
using Work = std::function<void()>;

/// The threads that all its queues share; they sleep while there is nothing to do (once a timer has been
/// used, they look up every five minutes). Thread-safe.
class WorkQueuePool {
 public:
  /// Throws std::system_error when the threads can't be started.
  explicit WorkQueuePool(std::size_t threads);
  /// As `stop`.
  ~WorkQueuePool();
  WorkQueuePool(const WorkQueuePool&) = delete;
  WorkQueuePool& operator=(const WorkQueuePool&) = delete;

  /// Waits for the work that is running, then ends the threads. Work that has not begun is destroyed without
  /// having run, and so is what is submitted later; queues, timers and sources may outlive the pool and do
  /// nothing any more. May be called twice; not from a thread of the pool.
  void stop();

 private:
  friend class WorkQueue;
  friend class WorkSource;
  friend class WorkTimer;
  friend class ReadSource;
  class Core;
  class Source;
  class Timer;
  class Watch;
  std::shared_ptr<Core> _core;
};

/// Runs its work one at a time, in the order of submission. Copies are the same queue. Thread-safe.
class WorkQueue {
 public:
  /// `label` names the queue in log lines; a literal.
  explicit WorkQueue(WorkQueuePool& pool, const char* label = "WorkQueue");

  void submit(Work work);
  /// Once, not before `delay` is over. Can't be taken back; use a WorkTimer for that.
  void submitAfter(std::chrono::milliseconds delay, Work work);

 private:
  friend class WorkSource;
  friend class WorkTimer;
  friend class ReadSource;
  struct State;
  std::shared_ptr<State> _state;
};

/// Something that calls a handler on a queue until it is cancelled. Movable; the destructor cancels.
class WorkSource {
 public:
  ~WorkSource() { cancel(); }
  WorkSource(WorkSource&&) noexcept = default;
  WorkSource& operator=(WorkSource&& other) noexcept;

  /// The handler is not called any more once this has returned on its queue; elsewhere, a call that has begun
  /// already may still go on. What the handler captured is destroyed as soon as the handler does not run.
  /// From any thread, the handler itself included, any number of times, and after the pool was stopped.
  void cancel() noexcept;

 protected:
  WorkSource() noexcept = default;
  explicit WorkSource(const WorkQueue& queue);

  std::shared_ptr<void> _core;  ///< outlives the source
  std::shared_ptr<WorkQueuePool::Source> _source;
};

/// Fires once or again and again.
class WorkTimer : public WorkSource {
 public:
  /// A timer that does nothing.
  WorkTimer() noexcept = default;
  /// Fires after `first`, then every `interval`; with a zero interval it fires once. Firings that were missed
  /// are not made up for.
  WorkTimer(const WorkQueue& queue, std::chrono::milliseconds first, std::chrono::milliseconds interval,
            Work handler);
};

/// Calls its handler whenever a descriptor has something to read, and again while anything is left.
class ReadSource : public WorkSource {
 public:
  /// A source that does nothing.
  ReadSource() noexcept = default;
  /// Keeps its share of the descriptor until the queue gets to know of the cancellation, since the number of
  /// one that is watched must not be used again. Throws std::system_error for one that can't be watched.
  ReadSource(const WorkQueue& queue, std::shared_ptr<const FileDescriptor> descriptor, Work handler);
};

}  // namespace vesk
