// Limits durations that a host chooses.
#pragma once

#include <algorithm>
#include <chrono>

namespace vesk {

/// Limits `wait` to between zero and a day. Longer values mean "for ever", and adding them to a clock's
/// reading must not overflow.
constexpr std::chrono::milliseconds boundedWait(std::chrono::milliseconds wait) noexcept {
  return std::clamp<std::chrono::milliseconds>(wait, std::chrono::milliseconds(0), std::chrono::hours(24));
}

}  // namespace vesk
