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

  /// Readable since the process last became busy or idle; for the run loop, which then calls `acknowledge`.
  int descriptor() const noexcept { return _changed.get(); }
  void acknowledge() noexcept;

 private:
  void noteChange() noexcept;

  const FileDescriptor _changed;
  std::atomic<unsigned> _count{0};
};

}  // namespace vesk
