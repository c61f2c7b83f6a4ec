// Decides when to try to reach the daemon again.
#pragma once

#include <algorithm>
#include <chrono>

#include "client/BoundedWait.h"

namespace vesk {

/// Waits double with each failure, from the first to the last. During a wait, a queued message allows one
/// early attempt, because it may well be the daemon's return that caused it. Only one is allowed, so that a
/// busy client does not hammer on an unserved socket. Depends only on `now`. Not thread-safe.
class ReconnectPolicy {
 public:
  using Time = std::chrono::steady_clock::time_point;
  using Wait = std::chrono::milliseconds;

  ReconnectPolicy(Wait first, Wait last)
      : _first(std::max(boundedWait(first), Wait{1})),
        _last(std::max(boundedWait(last), _first)),
        _wait(_first) {}

  /// When the next attempt is due; in the past before the first failure.
  Time due() const noexcept { return _due; }
  bool mayTryEarly() const noexcept { return _mayTryEarly; }

  /// An early attempt begins.
  void triedEarly() noexcept { _mayTryEarly = false; }

  /// An attempt failed at `now`. An early attempt doesn't change the current wait.
  void failed(Time now) noexcept {
    if (now < _due) return;
    _due = now + _wait;
    _wait = std::min(_wait * 2, _last);
    _mayTryEarly = true;
  }

  /// The daemon was reached.
  void succeeded() noexcept {
    _wait = _first;
    _due = Time{};
    _mayTryEarly = false;
  }

 private:
  const Wait _first;
  const Wait _last;
  Wait _wait;
  Time _due{};
  bool _mayTryEarly = false;
};

}  // namespace vesk
