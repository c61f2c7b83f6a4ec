// The commands for people who write storebags: they need neither a key nor a daemon.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace CLI {
class App;
}

namespace vesk {

struct Invocation;

/// What their command lines say.
struct StorebagOptions {
  bool strict = false;               ///< warnings count as errors
  std::string against;               ///< the storebag before a change
  std::vector<std::string> devices;  ///< files with facts, or "key=value,…"
  std::string storebag;   ///< in place of the one that a file of cases names; that `explain` looks at
  bool asManual = false;  ///< the reference as a manual page
};

/// Adds the options with which `explain` needs no daemon.
void addOfflineExplain(CLI::App& explain, Invocation& invocation);
/// The facts that the command line gives to `explain`.
std::optional<Dictionary> explainedDevice(const Invocation& invocation);
/// The daemon's answer to that request of `explain`, for the storebag and the device on the command line.
/// Throws std::runtime_error if they can't be read.
Dictionary explainOffline(const Invocation& invocation, const Dictionary& request);

/// Adds them to the command `storebag`. Both must outlive the parsing.
void addStorebagAuthoring(CLI::App& storebag, Invocation& invocation);

}  // namespace vesk
