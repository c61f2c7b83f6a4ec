// Reads the command line.
#pragma once

#include <optional>

#include "tools/veskreport/Invocation.h"

namespace vesk {

struct CommandLine {
  std::optional<Invocation> invocation;  ///< absent if the tool should just exit
  int exitStatus = 0;                    ///< used then; help, version or error have been printed
};

CommandLine parseCommandLine(int argc, char** argv);

}  // namespace vesk
