// Readable dates in UTC. Avoids the C library's conversions, which share time zone state between threads.
#pragma once

#include <string>

#include "platform/time/Clock.h"

namespace vesk {

/// "2026-11-24 20:31:29", without a fraction. Accepts any time. Thread-safe; takes no lock.
std::string civilTime(WallTime time);

}  // namespace vesk
