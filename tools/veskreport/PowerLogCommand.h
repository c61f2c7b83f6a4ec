// Shows the device's power log.
#pragma once

#include <optional>
#include <string>

#include "platform/time/Clock.h"
#include "tools/veskreport/Invocation.h"
#include "tools/veskreport/Output.h"

namespace vesk {

/// Exit status.
int runPowerLog(const Invocation& invocation, const Output& output);

/// The time that `text` means: "90s", "15m", "2h" and "7d" before `now`, or a UTC time of the form
/// "2026-11-24T18:30:00Z", of which the time of day and the "Z" may be left out. Nothing for any other text.
std::optional<WallTime> timeMeantBy(const std::string& text, WallTime now);

}  // namespace vesk
