// Confinement of the process.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// Enters the sandbox that the profile describes, for good: no new privileges, files by Landlock, system
/// calls by a seccomp filter. The profile is /usr/share/veskreporting/sandbox/<profileName>.toml under the
/// root prefix; what it may say stands in SandboxProfile.h.
///
/// Fails once the process has another thread: Landlock holds the calling thread and every thread made later.
/// Returns why the sandbox could not be entered; the process may be half confined then, and should
/// end.
[[nodiscard]] std::optional<std::string> enterSandbox(std::string_view profileName);

}  // namespace vesk
