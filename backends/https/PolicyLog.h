// Logs a policy's decisions.
#pragma once

#include <string>

#include "backends/https/PostPolicy.h"

namespace vesk {

/// Logs the step, if there is a line for it.
void logPolicyStep(const PostPolicy::Step& step, const std::string& backendName, double samplingFactor);

}  // namespace vesk
