// Dates for people, in UTC. The C library's own conversions share its time zone state between threads.
#pragma once

#include <string>

#include "platform/time/Clock.h"

namespace vesk {

/// "2026-11-24 20:31:29", without a fraction. Any time; thread-safe, takes no lock.
std::string civilTime(WallTime time);

}  // namespace vesk
