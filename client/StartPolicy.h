// Decides when a session starts again by itself.
#pragma once

#include <algorithm>
#include <chrono>

namespace vesk {

/// A start that gave no configuration is repeated after 900 s, when the daemon may fetch a storebag again,
/// and then after waits that double up to 48 minutes. Each wait is up to a quarter longer at random, so that
/// many clients don't return together. A start that gave one is repeated after the refresh interval, if
/// there is one. Depends only on its arguments. Not thread-safe.
class StartPolicy {
 public:
  using Time = std::chrono::steady_clock::time_point;

  static constexpr std::chrono::seconds kFirstWait{900};
  static constexpr std::chrono::seconds kLongestWait{3600};  ///< with its random part

  /// `refreshInterval`: 0 for none, otherwise at least a second.
  explicit StartPolicy(std::chrono::milliseconds refreshInterval)
      : _refreshInterval(refreshInterval.count() <= 0
                             ? std::chrono::milliseconds(0)
                             : std::clamp<std::chrono::milliseconds>(refreshInterval, std::chrono::seconds(1),
                                                                     std::chrono::hours(24 * 365))) {}

  /// When the next start is due; the end of time if none is.
  Time due() const noexcept { return _due; }

  /// A start was sent, or the connection was lost, after which the daemon needs another one anyway.
  void started() noexcept { _due = Time::max(); }
  /// `random`: from [0, 1).
  void answeredWithNothing(Time now, double random) noexcept {
    _due = now + std::chrono::duration_cast<Time::duration>(_wait * (1 + random / 4));
    _wait = std::min(_wait * 2, kLongestWait * 4 / 5);
  }
  void answeredWithConfiguration(Time now) noexcept {
    _wait = kFirstWait;
    _due = _refreshInterval.count() > 0 ? now + _refreshInterval : Time::max();
  }

 private:
  const std::chrono::milliseconds _refreshInterval;
  std::chrono::seconds _wait = kFirstWait;
  Time _due = Time::max();
};

}  // namespace vesk
