// How long the sessions of a process may wait at their end, together.
#pragma once

#include <algorithm>
#include <atomic>
#include <chrono>

namespace vesk {

/// A host that destroys many sessions while the daemon hangs waits once, not once for each: what one session
/// has waited, the others can't wait for as long again. A function of the times that it is given.
/// Thread-safe.
class DrainBudget {
 public:
  using Clock = std::chrono::steady_clock;
  using Wait = std::chrono::milliseconds;

  /// What a session may take in any case: enough for a daemon that is well.
  static constexpr Wait kLeast{10};

  /// The process's.
  static DrainBudget& shared() noexcept {
    static constinit DrainBudget budget;
    return budget;
  }

  /// How much of `drainTime` a session may take that ends at `now`.
  Wait grant(Wait drainTime, Clock::time_point now) const noexcept {
    const Clock::time_point recovered{Clock::duration(_recovered.load())};
    const auto owed = std::max(std::chrono::ceil<Wait>(recovered - now), Wait(0));
    return std::max(drainTime - owed, std::min(kLeast, drainTime));
  }

  /// A session has waited for `wait`, until `now`.
  void spend(Clock::duration wait, Clock::time_point now) noexcept {
    const auto recovered = (now + wait).time_since_epoch().count();
    auto known = _recovered.load();
    while (known < recovered && !_recovered.compare_exchange_weak(known, recovered)) {
    }
  }

 private:
  std::atomic<Clock::rep> _recovered{0};  ///< when nothing is owed any more
};

}  // namespace vesk
