// Restricts the system calls that the process may make.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "platform/result/Result.h"

namespace vesk {

/// Permanently denies groups of system calls to every thread of the process. A denied call fails with EPERM,
/// or with ENOSYS where a library can fall back on an older call. Calls of a foreign architecture kill the
/// process. Requires no_new_privs.
///
/// The filter denies what a daemon doesn't need and allows the rest. An allow list would have to name every
/// call that future versions of the libraries may make. `groups` must be known groups.
Result<void> denyCalls(const std::vector<std::string>& groups);

/// Whether there is a group with that name. The groups: "execute" (run a program), "processes" (create one),
/// "other-processes" (signal, limit or schedule another one), "trace" (inspect another one), "namespaces",
/// "mounts", "kernel" (modules, kexec, BPF, tuning), "clock", "identity" (user, group, capabilities),
/// "ownership" (owner and extended attributes of files), "modes" (who may use a file), "truncation" (of files
/// by path, which Landlock's first versions don't restrict), "handles" (open files by handle), "devices"
/// (make device nodes, push input into a terminal), "keys" (kernel key rings), "faults" (userfaultfd),
/// "io-uring", "sockets" (all except Unix, IP and routing sockets; raw sockets), "writable-code" (memory that
/// is both writable and executable, files in memory) and "new-code" (executable mappings that don't exist
/// yet: no bundle or name-service plug-in can be loaded any more).
bool isCallGroup(std::string_view name);

}  // namespace vesk
