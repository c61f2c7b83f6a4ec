// Reads the power log's file.
#pragma once

#include <string>
#include <vector>

#include "platform/powerlog/PowerLogFile.h"

namespace vesk {

/// Returns the events from `since` on, oldest first. Works while a daemon writes. Takes memory for all of
/// them, which the file's limit bounds, so that the file is closed when they are shown, which may take as
/// long as a person reads.
Result<std::vector<PowerLogEvent>> readPowerLog(const std::string& path, WallTime since);

}  // namespace vesk
