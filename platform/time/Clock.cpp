#include "platform/time/Clock.h"

#include <ctime>

namespace vesk {

namespace {

class SystemWallClock final : public WallClock {
 public:
  WallTime now() const override {
    return std::chrono::floor<std::chrono::microseconds>(std::chrono::system_clock::now());
  }
};

}  // namespace

std::chrono::seconds systemUptime() noexcept {
  timespec time{};
  ::clock_gettime(CLOCK_BOOTTIME, &time);
  return std::chrono::seconds(time.tv_sec);
}

const WallClock& WallClock::system() {
  static const SystemWallClock clock;
  return clock;
}

}  // namespace vesk
