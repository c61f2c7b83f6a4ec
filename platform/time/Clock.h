// The clocks, injected wherever a policy depends on time.
#pragma once

#include <sys/time.h>

#include <chrono>

namespace vesk {

using WallTime = std::chrono::sys_time<std::chrono::microseconds>;

/// Wall-clock time; may jump either way. Thread-safe.
class WallClock {
 public:
  virtual ~WallClock() = default;
  virtual WallTime now() const = 0;

  /// The machine's clock; lives as long as the process.
  static const WallClock& system();
};

/// How long the machine has been up, the time that it slept included. Goes on evenly, whatever is done to the
/// wall clock.
std::chrono::seconds systemUptime() noexcept;

/// A wall time as POSIX has it.
inline timeval timevalFrom(WallTime time) {
  auto seconds = std::chrono::floor<std::chrono::seconds>(time);
  timeval value{};
  value.tv_sec = seconds.time_since_epoch().count();
  value.tv_usec = (time - seconds).count();
  return value;
}

/// And back.
inline WallTime wallTimeFrom(const timeval& time) {
  return WallTime(std::chrono::seconds(time.tv_sec) + std::chrono::microseconds(time.tv_usec));
}

}  // namespace vesk
