// Locks that processes share by the name of a file.
#pragma once

#include <chrono>
#include <string>

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// Opens the file at `path`, made as `makePrivateFile` does where it is missing, and locks it until `lock` is
/// closed, against other processes and other descriptors of this one. Waits `patience` at most for another's
/// lock to go. 0 or the system's error number, EWOULDBLOCK when another kept the lock; `lock` is empty then.
[[nodiscard]] int lockFile(FileDescriptor& lock, const std::string& path, std::chrono::milliseconds patience);

}  // namespace vesk
