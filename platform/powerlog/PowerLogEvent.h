// One event of the power log.
#pragma once

#include <cstdint>
#include <string>

#include "platform/time/Clock.h"

namespace vesk {

/// The log's file, as on a device.
inline constexpr char kPowerLogPath[] = "/var/lib/veskreportingd/power-log.sqlite";

struct PowerLogEvent {
  std::uint32_t identifier = 0;  ///< which kind of event it is registered as
  std::string name;
  WallTime time{};
  std::string dictionary;  ///< JSON object
};

}  // namespace vesk
