// The file of the power log, to be read.
#pragma once

#include <functional>
#include <string>

#include "platform/powerlog/PowerLogFile.h"

namespace vesk {

/// Hands the events of `since` and later to `take`, oldest first, until that returns false. Works while a
/// daemon writes, and takes no note of what it adds meanwhile; `take` may be slow without being in its way.
/// What went wrong comes back as text; empty: nothing did.
[[nodiscard]] std::string readPowerLog(const std::string& path, WallTime since,
                                       const std::function<bool(const PowerLogEvent& event)>& take);

}  // namespace vesk
