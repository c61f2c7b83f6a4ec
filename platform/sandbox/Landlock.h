// Restricts the files, ports and processes that the process may use.
#pragma once

#include "platform/result/Result.h"
#include "platform/sandbox/SandboxProfile.h"

namespace vesk {

/// Denies the calling thread, and every thread created later, all files except the profile's paths, and any
/// tracing or inspection of outside processes. Descriptors that are already open keep working. Programs can't
/// be run from anywhere. Requires no_new_privs. A kernel without Landlock is an error if the profile requires
/// it; otherwise it is logged in one line of level 4.
///
/// If the kernel supports it, no TCP port can be bound and only the profile's ports can be connected to
/// (version 4), and neither signals nor abstract Unix sockets reach an outside process (version 6). An older
/// kernel restricts less, which is not an error.
Result<void> enterLandlock(const SandboxProfile& profile);

}  // namespace vesk
