// Restricts the files, ports and processes that the process may use.
#pragma once

#include "platform/result/Result.h"
#include "platform/sandbox/SandboxProfile.h"

namespace vesk {

/// Denies the calling thread, and every thread created later, all files except the profile's paths, running
/// programs, and any tracing or inspection of outside processes. Descriptors that are already open keep
/// working. Requires no_new_privs. A kernel without Landlock is an error if the profile requires it,
/// otherwise one line of level 4.
///
/// If the kernel supports it, no TCP port can be bound and only the profile's ports can be connected to
/// (version 4), and neither signals nor abstract Unix sockets reach an outside process (version 6).
Result<void> enterLandlock(const SandboxProfile& profile);

}  // namespace vesk
