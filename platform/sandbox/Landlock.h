// Which files, ports and processes the process may use.
#pragma once

#include <optional>
#include <string>

#include "platform/sandbox/SandboxProfile.h"

namespace vesk {

/// Denies the calling thread, and every thread made later, all files but the profile's paths; also
/// connections that would trace or inspect a process outside. Descriptors that are open already keep working.
/// Programs can't be run from anywhere. Needs no_new_privs. A kernel without Landlock is an error when the
/// profile requires it; otherwise it costs one level-4 line.
///
/// Where the kernel knows how: no TCP port can be bound, only the profile's ports can be connected to
/// (version 4), and neither signals nor abstract Unix sockets reach a process outside (version 6). An older
/// kernel restricts less, which is no error. Returns what went wrong.
[[nodiscard]] std::optional<std::string> enterLandlock(const SandboxProfile& profile);

}  // namespace vesk
