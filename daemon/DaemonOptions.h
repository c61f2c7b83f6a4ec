// The daemon's command line.
#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <variant>

namespace vesk {

struct DaemonOptions {
  std::optional<std::string> root;               ///< replaces "/" in every path of the daemon
  int logLevel = 6;                              ///< 3, 4, 6 or 7
  std::optional<std::chrono::seconds> idleExit;  ///< how long to run without a client; nullopt: for ever
  bool sandbox = true;
};

/// Returns the options, or the exit status if the command line asks for help or is invalid; the text has been
/// printed to the terminal.
std::variant<DaemonOptions, int> parseDaemonOptions(int argc, char** argv);

}  // namespace vesk
