// The profile of a sandbox: what a confined process may do.
#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/result/Result.h"

namespace vesk {

/// A file, or a directory with its contents, that the process may use.
struct SandboxPath {
  std::string path;          ///< absolute, root prefix included
  std::uint64_t rights = 0;  ///< Landlock's
  bool isOptional = false;   ///< ignored if it is missing
  std::filesystem::perms created =
      std::filesystem::perms::none;  ///< of a missing directory; none: not created
};

struct SandboxProfile {
  /// Whether a kernel without Landlock is an error. Otherwise only the system-call filter applies there.
  bool landlockRequired = true;
  std::vector<SandboxPath> paths;
  /// TCP ports of servers that may be connected to; nullopt for all ports.
  std::optional<std::vector<std::uint16_t>> connectPorts;
  std::vector<std::string> deniedCalls;  ///< names of groups known to Seccomp.h
};

/// Reads a profile from TOML. Unknown keys and groups of calls are errors: a typo must not widen access.
///
///     landlock = "required"           # or "if-available"
///     [machine]                       # paths of the machine, independent of the root prefix
///     read = […]                      # must exist
///     read-if-present = […]
///     write = […]                     # a missing directory is created (0750)
///     sockets = […]                   # likewise (0755, so that clients can reach the socket)
///     remove-if-present = […]         # files below may be removed, but neither read nor written
///     [root]                          # the same keys, for paths under the root prefix
///     [network]
///     connect = [53, 443]             # TCP ports that may be connected to; without this key, all
///     [calls]
///     deny = […]
///
/// A path may begin with an environment variable ("$HOME/.config"); the entry is left out if that is unset or
/// not an absolute path. Paths are resolved textually: "$SSL_CERT_FILE/.." is the directory of that file.
Result<SandboxProfile> parseSandboxProfile(std::string_view toml);

}  // namespace vesk
