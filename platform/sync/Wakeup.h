// Wakes a thread that waits in poll().
#pragma once

#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <system_error>

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// Readable from `signal` until `clear`. Thread-safe; `signal` never blocks.
class Wakeup {
 public:
  Wakeup() : _event(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
    if (!_event) throw std::system_error(errno, std::generic_category(), "eventfd");
  }

  int fd() const noexcept { return _event.get(); }

  void signal() const noexcept {
    std::uint64_t one = 1;
    [[maybe_unused]] auto written = ::write(_event.get(), &one, sizeof one);
  }

  void clear() const noexcept {
    std::uint64_t count = 0;
    [[maybe_unused]] auto taken = ::read(_event.get(), &count, sizeof count);
  }

 private:
  FileDescriptor _event;
};

}  // namespace vesk
