// Shows the messages of a family of sessions as the aggregating client gets them.
#pragma once

#include "tools/veskreport/Invocation.h"
#include "tools/veskreport/Output.h"

namespace vesk {

/// Runs until the daemon closes the aggregation, as many messages have come as were asked for, or SIGINT or
/// SIGTERM arrives. Blocks these two for the process. Returns the exit status.
int runAggregate(const Invocation& invocation, const Output& output);

}  // namespace vesk
