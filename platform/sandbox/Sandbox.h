// Confines the process.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// Permanently enters the sandbox that the profile describes: no new privileges, files restricted by
/// Landlock, system calls by a seccomp filter. The profile is
/// /usr/share/veskreporting/sandbox/<profileName>.toml under the root prefix; SandboxProfile.h documents its
/// format.
///
/// Fails if the process already has another thread, since Landlock confines only the calling thread and
/// threads created later. Returns a description of the error, if any; the process may then be partly confined
/// and should exit.
[[nodiscard]] std::optional<std::string> enterSandbox(std::string_view profileName);

}  // namespace vesk
