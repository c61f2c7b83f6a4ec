// Durations that a host chooses.
#pragma once

#include <algorithm>
#include <chrono>

namespace vesk {

/// `wait`, but not less than none and not more than a day: what is longer means "for ever", and a clock's
/// reading must be able to hold it.
constexpr std::chrono::milliseconds boundedWait(std::chrono::milliseconds wait) noexcept {
  return std::clamp<std::chrono::milliseconds>(wait, std::chrono::milliseconds(0), std::chrono::hours(24));
}

}  // namespace vesk
