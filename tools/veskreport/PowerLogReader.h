// Reads the power log's file.
#pragma once

#include <functional>
#include <string>

#include "platform/powerlog/PowerLogFile.h"

namespace vesk {

/// Passes the events from `since` on to `take`, oldest first, until it returns false. Works while a daemon
/// writes, and ignores events added meanwhile. A slow `take` does not block the daemon.
Result<void> readPowerLog(const std::string& path, WallTime since,
                          const std::function<bool(const PowerLogEvent& event)>& take);

}  // namespace vesk
