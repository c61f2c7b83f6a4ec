#pragma once

#include <atomic>
#include <chrono>

#include "platform/time/Clock.h"

namespace vesk::test {

/// A wall clock that stands still until it is set.
class HandClock final : public WallClock {
 public:
  explicit HandClock(double seconds = 1'700'000'000) { set(seconds); }
  WallTime now() const override { return WallTime(std::chrono::microseconds(_microseconds.load())); }
  void set(double seconds) { _microseconds = static_cast<std::int64_t>(seconds * 1e6); }
  void advance(std::chrono::seconds by) { _microseconds += std::chrono::microseconds(by).count(); }

 private:
  std::atomic<std::int64_t> _microseconds{0};
};

}  // namespace vesk::test
