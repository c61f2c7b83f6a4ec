// Reads the command line.
#pragma once

#include <optional>

#include "tools/veskreport/Invocation.h"

namespace vesk {

struct CommandLine {
  std::optional<Invocation> invocation;  ///< absent: there is nothing to do but to exit
  int exitStatus = 0;                    ///< then; help, version or what was wrong have been printed
};

CommandLine parseCommandLine(int argc, char** argv);

}  // namespace vesk
