// The commands that send messages given on the command line.
#pragma once

#include "tools/veskreport/Invocation.h"
#include "tools/veskreport/Output.h"

namespace vesk {

/// These return the exit status.
int runSend(const Invocation& invocation, const Output& output);
int runSendOnce(const Invocation& invocation, const Output& output);

}  // namespace vesk
