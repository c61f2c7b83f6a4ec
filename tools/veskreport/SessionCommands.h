// The commands that perform one operation in a session of their own.
#pragma once

#include "tools/veskreport/Invocation.h"
#include "tools/veskreport/Output.h"

namespace vesk {

/// These return the exit status.
int runStates(const Invocation& invocation, const Output& output);
int runDisplayURL(const Invocation& invocation, const Output& output);
int runFlush(const Invocation& invocation, const Output& output);
int runUploadFile(const Invocation& invocation, const Output& output);
int runUploadLog(const Invocation& invocation, const Output& output);

}  // namespace vesk
