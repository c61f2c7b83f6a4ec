// Which system calls the process may make.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vesk {

/// Denies groups of system calls to every thread of the process, for good. A denied call fails with EPERM (or
/// ENOSYS where a library knows an older call to fall back on). Calls of a foreign architecture kill the
/// process. Needs no_new_privs.
///
/// The filter denies what a daemon has no business with and allows the rest. The other way round, a list of
/// what is allowed, would have to name every call that the libraries' next versions may choose to make.
/// `groups` are known ones. Returns what went wrong.
[[nodiscard]] std::optional<std::string> denyCalls(const std::vector<std::string>& groups);

/// Whether there is a group of that name. The groups:
/// "execute" (run a program), "processes" (make one), "other-processes" (signal, limit or schedule another
/// one), "trace" (look into another one), "namespaces", "mounts", "kernel" (modules, kexec, BPF, tuning),
/// "clock", "identity" (user, group, capabilities), "ownership" (owner and extended attributes of files),
/// "modes" (who may use a file), "truncation" (of files by path, which Landlock's first versions don't
/// restrict), "handles" (open files by handle), "devices" (make device nodes, push input into a terminal),
/// "keys" (kernel key rings), "faults" (userfaultfd), "io-uring", "sockets" (all but Unix, IP and routing
/// sockets; raw sockets), "writable-code" (memory that is both writable and executable, files in memory) and
/// "new-code" (anything executable that is not mapped yet: no bundle and no name-service plug-in can be
/// loaded any more).
bool isCallGroup(std::string_view name);

}  // namespace vesk
