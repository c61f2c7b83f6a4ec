// One log line for a burst of alike events.
#pragma once

#include <chrono>
#include <optional>

namespace vesk {

/// A burst ends when nothing happened for `kQuiet`, so that a peer that misbehaves without end costs one
/// line. For one thread.
class WarningBurst {
 public:
  static constexpr std::chrono::seconds kQuiet{10};

  /// Notes an event; true for the first of a burst.
  bool begins(std::chrono::steady_clock::time_point now = std::chrono::steady_clock::now()) noexcept {
    bool first = !_last || now - *_last >= kQuiet;
    _last = now;
    return first;
  }

 private:
  std::optional<std::chrono::steady_clock::time_point> _last;
};

}  // namespace vesk
