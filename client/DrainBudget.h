// Limits how long the sessions of a process wait when they end, together.
#pragma once

#include <algorithm>
#include <atomic>
#include <chrono>

namespace vesk {

/// A host that destroys many sessions while the daemon hangs waits once, not once per session: time that one
/// session has waited is not available to the others. Depends only on the times passed in. Thread-safe.
class DrainBudget {
 public:
  using Clock = std::chrono::steady_clock;
  using Wait = std::chrono::milliseconds;

  /// What a session may always take: enough for a healthy daemon.
  static constexpr Wait kLeast{10};

  /// The instance for the process.
  static DrainBudget& shared() noexcept {
    static constinit DrainBudget budget;
    return budget;
  }

  /// How much of `drainTime` a session that ends at `now` may take.
  Wait grant(Wait drainTime, Clock::time_point now) const noexcept {
    const Clock::time_point recovered{Clock::duration(_recovered.load())};
    const auto owed = std::max(std::chrono::ceil<Wait>(recovered - now), Wait(0));
    return std::max(drainTime - owed, std::min(kLeast, drainTime));
  }

  /// Records that a session waited for `wait`, until `now`.
  void spend(Clock::duration wait, Clock::time_point now) noexcept {
    const auto recovered = (now + wait).time_since_epoch().count();
    auto known = _recovered.load();
    while (known < recovered && !_recovered.compare_exchange_weak(known, recovered)) {
    }
  }

 private:
  std::atomic<Clock::rep> _recovered{0};  ///< when the budget is full again
};

}  // namespace vesk
