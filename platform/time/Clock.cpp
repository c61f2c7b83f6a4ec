#include "platform/time/Clock.h"

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

}  // namespace vesk
