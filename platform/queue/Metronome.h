// A periodic beat that costs nothing while paused.
#pragma once

#include <chrono>
#include <memory>

#include "platform/queue/TimedQueue.h"

namespace vesk {

/// Calls a handler on a queue at every beat: at the start, then once per interval. While paused it keeps its
/// rhythm but has neither a timer nor the handler, so that thousands may idle; when resumed, it continues
/// with the next regular beat. Used only on its queue; the constructor may run elsewhere.
class Metronome {
 public:
  /// Paused until `start`. `interval` must be positive; `queue` must outlive this object.
  Metronome(TimedQueue& queue, std::chrono::milliseconds interval)
      : _queue(queue), _interval(interval), _origin(queue.now()) {}

  /// The first beat is now.
  void start(Work handler);
  /// Call only while paused.
  void resume(Work handler);
  /// The handler is not called again, and is destroyed once it is not running. The handler may call this.
  void pause() noexcept { _timer.reset(); }
  bool isPaused() const noexcept { return _timer == nullptr; }

 private:
  TimedQueue& _queue;
  const std::chrono::milliseconds _interval;
  TimedQueue::Clock::time_point _origin;
  std::unique_ptr<TimedQueue::Source> _timer;
};

}  // namespace vesk
