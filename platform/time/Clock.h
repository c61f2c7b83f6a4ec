// The clocks, which are injected wherever a policy depends on time.
#pragma once

#include <sys/time.h>

#include <chrono>

namespace vesk {

using WallTime = std::chrono::sys_time<std::chrono::microseconds>;

/// Wall-clock time, which may jump forwards or backwards. Thread-safe.
class WallClock {
 public:
  virtual ~WallClock() = default;
  virtual WallTime now() const = 0;

  /// The machine's clock. Never destroyed.
  static const WallClock& system();
};

/// Whether the kernel considers the wall clock synchronised, for example by NTP.
bool kernelClockIsSet();

/// Converts a wall time to POSIX form.
inline timeval timevalFrom(WallTime time) {
  auto seconds = std::chrono::floor<std::chrono::seconds>(time);
  timeval value{};
  value.tv_sec = seconds.time_since_epoch().count();
  value.tv_usec = (time - seconds).count();
  return value;
}

/// Converts back.
inline WallTime wallTimeFrom(const timeval& time) {
  return WallTime(std::chrono::seconds(time.tv_sec) + std::chrono::microseconds(time.tv_usec));
}

}  // namespace vesk
