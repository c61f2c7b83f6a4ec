// Confines the process.
#pragma once

#include <string_view>

#include "platform/result/Result.h"

namespace vesk {

/// Permanently enters the sandbox that the profile describes: no new privileges, files restricted by
/// Landlock, system calls by a seccomp filter. The profile is
/// /usr/share/veskreporting/sandbox/<profileName>.toml under the root prefix; SandboxProfile.h documents its
/// format.
///
/// Fails if the process already has another thread, since Landlock confines only the calling thread and
/// threads created later. After a failure the process may be partly confined and should exit.
Result<void> enterSandbox(std::string_view profileName);

}  // namespace vesk
