// A beat that costs nothing while nobody listens to it.
#pragma once

#include <chrono>
#include <memory>

#include "platform/queue/TimedQueue.h"

namespace vesk {

/// Calls a handler on a queue at every beat: at the start and then once an interval. Paused, it keeps its
/// beat but neither a timer nor the handler, so that thousands may idle; resumed, it goes on with the next
/// beat that it would have had anyway. Used on its queue only; the constructor may run elsewhere.
class Metronome {
 public:
  /// Paused until `start`. `interval` is more than zero; `queue` outlives it.
  Metronome(TimedQueue& queue, std::chrono::milliseconds interval)
      : _queue(queue), _interval(interval), _origin(queue.now()) {}

  /// The first beat is now.
  void start(Work handler);
  /// To be called when it is paused.
  void resume(Work handler);
  /// The handler is not called any more, and destroyed as soon as it does not run; it may call this itself.
  void pause() noexcept { _timer.reset(); }
  bool isPaused() const noexcept { return _timer == nullptr; }

 private:
  TimedQueue& _queue;
  const std::chrono::milliseconds _interval;
  TimedQueue::Clock::time_point _origin;
  std::unique_ptr<TimedQueue::Source> _timer;
};

}  // namespace vesk
