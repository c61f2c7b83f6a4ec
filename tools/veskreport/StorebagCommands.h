// The commands that create and examine storebags.
#pragma once

#include "tools/veskreport/Invocation.h"
#include "tools/veskreport/Output.h"

namespace vesk {

/// These return the exit status.
int runStorebagKeygen(const StorebagArguments& arguments, const Output& output);
int runStorebagSign(const StorebagArguments& arguments, const Output& output);
int runStorebagVerify(const StorebagArguments& arguments, const Output& output);
int runStorebagShow(const StorebagArguments& arguments, const Output& output);

}  // namespace vesk
