#include "platform/time/Clock.h"

#include <sys/timex.h>

namespace vesk {

namespace {

class SystemWallClock final : public WallClock {
 public:
  WallTime now() const override {
    return std::chrono::floor<std::chrono::microseconds>(std::chrono::system_clock::now());
  }
};

}  // namespace

const WallClock& WallClock::system() {
  static const SystemWallClock clock;
  return clock;
}

bool kernelClockIsSet() {
  timex state{};
  const int result = ::adjtimex(&state);
  return result >= 0 && result != TIME_ERROR && (state.status & STA_UNSYNC) == 0;
}

}  // namespace vesk
