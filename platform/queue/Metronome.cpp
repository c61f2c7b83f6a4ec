#include "platform/queue/Metronome.h"

#include <utility>

namespace vesk {

void Metronome::start(Work handler) {
  _origin = _queue.now();
  _timer = _queue.makeTimer(std::chrono::milliseconds::zero(), _interval, std::move(handler));
}

void Metronome::resume(Work handler) {
  const auto sinceBeat = (_queue.now() - _origin) % _interval;
  const auto untilBeat = std::chrono::ceil<std::chrono::milliseconds>(_interval - sinceBeat);
  _timer = _queue.makeTimer(untilBeat, _interval, std::move(handler));
}

}  // namespace vesk
