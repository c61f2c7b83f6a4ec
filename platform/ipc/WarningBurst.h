// Limits a burst of similar events to one log line.
#pragma once

#include <chrono>
#include <optional>

namespace vesk {

/// A burst ends after `kQuiet` without an event, so that a peer that misbehaves continuously causes only one
/// line. Not thread-safe.
class WarningBurst {
 public:
  static constexpr std::chrono::seconds kQuiet{10};

  /// Records an event. Returns true for the first of a burst.
  bool begins(std::chrono::steady_clock::time_point now = std::chrono::steady_clock::now()) noexcept {
    bool first = !_last || now - *_last >= kQuiet;
    _last = now;
    return first;
  }

 private:
  std::optional<std::chrono::steady_clock::time_point> _last;
};

}  // namespace vesk
