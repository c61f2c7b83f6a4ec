// Locks between processes, identified by a file's path.
#pragma once

#include <chrono>
#include <string>

#include "platform/files/FileDescriptor.h"
#include "platform/result/Result.h"

namespace vesk {

/// Opens the file at `path`, creating it like `makePrivateFile` if missing, and locks it until the returned
/// descriptor is closed. The lock excludes other processes and other descriptors of this one. Waits up to
/// `patience` for another holder; the error's kind is Busy if the lock is still held then.
Result<FileDescriptor> lockFile(const std::string& path, std::chrono::milliseconds patience);

}  // namespace vesk
