// The profile of a sandbox: what a confined process may still do.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vesk {

/// A file, or a directory with all that is in it, which the process may use.
struct SandboxPath {
  enum class Access : unsigned char {
    Read,
    Write,    ///< read, write, create, rename and remove files and directories
    Sockets,  ///< as `Write`, and Unix sockets may be bound there
    Remove    ///< remove files, nothing else
  };
  std::string path;  ///< absolute, root prefix included
  Access access = Access::Read;
  bool optional = false;  ///< nothing is granted when it is missing
};

struct SandboxProfile {
  /// Whether a kernel without Landlock is an error. When it isn't, only the system-call filter holds there.
  bool landlockRequired = true;
  std::vector<SandboxPath> paths;
  /// TCP ports of servers that may be connected to; nothing: all.
  std::optional<std::vector<std::uint16_t>> connectPorts;
  std::vector<std::string> deniedCalls;  ///< names of groups that Seccomp.h knows
};

struct SandboxProfileOutcome {
  std::optional<SandboxProfile> profile;
  std::string error;
};

/// Reads a profile from TOML. A key or a group of calls that is not known is an error: a slip of the pen must
/// not open a door.
///
///     landlock = "required"           # or "if-available"
///     [machine]                       # paths of the machine, whatever the root prefix is
///     read = […]                      # must exist
///     read-if-present = […]
///     write = […]                     # a directory that is missing is made (0750)
///     sockets = […]                   # likewise (0755: clients must get at the socket)
///     remove-if-present = […]         # files below may be removed, neither read nor written
///     [root]                          # the same keys, for paths under the root prefix
///     [network]
///     connect = [53, 443]             # TCP ports to connect to; without this key, all
///     [calls]
///     deny = […]
///
/// A path may begin with an environment variable ("$HOME/.config"); the entry is left out when that is
/// unset or no absolute path. A path is taken by its text: "$SSL_CERT_FILE/.." is the directory of that file.
SandboxProfileOutcome parseSandboxProfile(std::string_view toml);

/// Makes the directories to write to that are missing; returns why one could not be made.
[[nodiscard]] std::optional<std::string> makeDirectories(const std::vector<SandboxPath>& paths);

}  // namespace vesk
