// Shows the messages of a family of sessions, as its aggregating client receives them.
#pragma once

#include "tools/veskreport/Invocation.h"
#include "tools/veskreport/Output.h"

namespace vesk {

/// Runs until the daemon closes the aggregation, the requested number of messages has arrived, or SIGINT or
/// SIGTERM arrives. Blocks these two signals for the process. Returns the exit status.
int runAggregate(const Invocation& invocation, const Output& output);

}  // namespace vesk
