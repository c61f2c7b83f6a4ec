// Locks between processes, identified by a file's path.
#pragma once

#include <chrono>
#include <string>

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// Opens the file at `path`, creating it like `makePrivateFile` if missing, and locks it until `lock` is
/// closed. The lock excludes other processes and other descriptors of this one. Waits up to `patience` for
/// another holder. Returns 0 or the error number, EWOULDBLOCK if the lock is still held; `lock` is empty
/// then.
[[nodiscard]] int lockFile(FileDescriptor& lock, const std::string& path, std::chrono::milliseconds patience);

}  // namespace vesk
