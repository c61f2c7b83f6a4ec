// What the log says of a policy's decisions.
#pragma once

#include <string>

#include "backends/https/PostPolicy.h"

namespace vesk {

/// Writes the step's line, when it has one.
void logPolicyStep(const PostPolicy::Step& step, const std::string& backendName, double samplingFactor);

}  // namespace vesk
