// The daemon's command line.
#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <variant>

namespace vesk {

struct DaemonOptions {
  std::optional<std::string> root;               ///< stands for "/" in every path of the daemon
  int logLevel = 6;                              ///< 3, 4, 6 or 7
  std::optional<std::chrono::seconds> idleExit;  ///< how long to stay without a client; nothing: for ever
  bool sandbox = true;
};

/// The options, or the exit status when the command line asked for help or could not be understood (said on
/// the terminal).
std::variant<DaemonOptions, int> parseDaemonOptions(int argc, char** argv);

}  // namespace vesk
