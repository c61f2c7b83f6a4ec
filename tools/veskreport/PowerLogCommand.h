// Shows the device's power log.
#pragma once

#include <optional>
#include <string>

#include "platform/time/Clock.h"
#include "tools/veskreport/Invocation.h"
#include "tools/veskreport/Output.h"

namespace vesk {

/// Returns the exit status.
int runPowerLog(const Invocation& invocation, const Output& output);

/// Parses an age before `now` ("90s", "15m", "2h" or "7d") or a UTC time such as "2026-11-24T18:30:00Z",
/// where the time of day and the "Z" are optional. Returns nullopt for any other text.
std::optional<WallTime> timeMeantBy(const std::string& text, WallTime now);

}  // namespace vesk
