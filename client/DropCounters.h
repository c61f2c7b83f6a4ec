// What a session did not send, by reason.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>

#include <atomic>

namespace vesk {

/// For any thread.
class DropCounters {
 public:
  /// True for the first of a burst, of which the session's thread has to be told.
  bool queueFull() noexcept {
    _queueFull.fetch_add(1, std::memory_order_relaxed);
    if (_isBurst.load(std::memory_order_relaxed) || _isBurst.exchange(true)) return false;
    _isUntold.store(true, std::memory_order_relaxed);
    return true;
  }
  /// A burst has begun since this was asked last: it deserves a log line.
  bool takeBurst() noexcept {
    return _isUntold.load(std::memory_order_relaxed) && _isUntold.exchange(false, std::memory_order_relaxed);
  }
  void burstIsOver() noexcept { _isBurst.store(false, std::memory_order_relaxed); }
  void invalid() noexcept { _invalid.fetch_add(1, std::memory_order_relaxed); }
  void unsent(std::uint64_t calls = 1) noexcept { _unsent.fetch_add(calls, std::memory_order_relaxed); }

  ReportingDrops read() const noexcept {
    return {_queueFull.load(std::memory_order_relaxed), _invalid.load(std::memory_order_relaxed),
            _unsent.load(std::memory_order_relaxed)};
  }

 private:
  std::atomic<std::uint64_t> _queueFull{0};
  std::atomic<std::uint64_t> _invalid{0};
  std::atomic<std::uint64_t> _unsent{0};
  std::atomic<bool> _isBurst{false};
  std::atomic<bool> _isUntold{false};
};

}  // namespace vesk
