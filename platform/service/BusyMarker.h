// Keeps an idle daemon from stopping while it has work.
#pragma once

#include <atomic>

#include "platform/sync/Wakeup.h"

namespace vesk {

/// Counts outstanding work. The process is busy while the count is not zero; when it falls to zero, the run
/// loop's idle time starts. Thread-safe; no operation blocks.
class BusyMarker {
 public:
  /// Each `begin` must be followed by one `end`.
  void begin() noexcept;
  void end() noexcept;
  bool isBusy() const noexcept { return _count.load() > 0; }

  /// Notes that work was done, which may have left free memory behind. Wakes the run loop unless it will look
  /// anyway.
  void touch() noexcept;
  /// Whether work was done since the last `takeTouch`.
  bool isTouched() const noexcept { return _touched.load(); }
  bool takeTouch() noexcept { return _touched.exchange(false); }

  /// Readable after the process became busy or idle or did work. The run loop waits for it and then calls
  /// `acknowledge`.
  int descriptor() const noexcept { return _changed.fd(); }
  void acknowledge() noexcept { _changed.clear(); }

 private:
  const Wakeup _changed;
  std::atomic<unsigned> _count{0};
  std::atomic<bool> _touched{false};
};

}  // namespace vesk
