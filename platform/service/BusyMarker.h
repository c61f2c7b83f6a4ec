// The marker that keeps an idle daemon from stopping while it has work.
#pragma once

#include <atomic>

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// Counts outstanding work. While the count is not zero the process is busy; when it falls to zero, the run
/// loop's idle time starts. Thread-safe; neither operation blocks.
class BusyMarker {
 public:
  /// Throws std::system_error when there is no descriptor left.
  BusyMarker();

  /// Each `begin` is answered by one `end`.
  void begin() noexcept;
  void end() noexcept;
  bool isBusy() const noexcept { return _count.load() > 0; }

  /// Notes that work was done, which may have left memory behind that is free. Costs a wake-up of the run
  /// loop only when none is due for that anyway.
  void touch() noexcept;
  /// Whether there was any since the last `takeTouch`.
  bool isTouched() const noexcept { return _touched.load(); }
  bool takeTouch() noexcept { return _touched.exchange(false); }

  /// Readable since the process last became busy or idle, or did work; for the run loop, which then calls
  /// `acknowledge`.
  int descriptor() const noexcept { return _changed.get(); }
  void acknowledge() noexcept;

 private:
  void noteChange() noexcept;

  const FileDescriptor _changed;
  std::atomic<unsigned> _count{0};
  std::atomic<bool> _touched{false};
};

}  // namespace vesk
