#include "platform/service/BusyMarker.h"

#include <sys/eventfd.h>

#include <cerrno>
#include <system_error>

namespace vesk {

BusyMarker::BusyMarker() : _changed(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
  if (!_changed) throw std::system_error(errno, std::generic_category(), "eventfd");
}

void BusyMarker::begin() noexcept {
  if (_count.fetch_add(1) == 0) noteChange();
}

void BusyMarker::end() noexcept {
  if (_count.fetch_sub(1) != 1) return;
  _touched = true;
  noteChange();
}

void BusyMarker::touch() noexcept {
  if (!_touched.exchange(true)) noteChange();
}

void BusyMarker::acknowledge() noexcept {
  eventfd_t changes = 0;
  ::eventfd_read(_changed.get(), &changes);
}

void BusyMarker::noteChange() noexcept { ::eventfd_write(_changed.get(), 1); }

}  // namespace vesk
