#include "platform/service/BusyMarker.h"

namespace vesk {

void BusyMarker::begin() noexcept {
  if (_count.fetch_add(1) == 0) _changed.signal();
}

void BusyMarker::end() noexcept {
  if (_count.fetch_sub(1) != 1) return;
  _touched = true;
  _changed.signal();
}

void BusyMarker::touch() noexcept {
  if (!_touched.exchange(true)) _changed.signal();
}

}  // namespace vesk
