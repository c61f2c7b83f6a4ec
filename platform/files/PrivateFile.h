// Creates files for the program's own use.
#pragma once

#include <string>

#include "platform/files/FileDescriptor.h"
#include "platform/result/Result.h"

namespace vesk {

/// Creates a file at `path` with mode 0600, opened for reading and writing. The error's kind is Exists if
/// something is there. If root creates it, it belongs to the directory's owner, since that user needs it
/// later.
Result<FileDescriptor> makePrivateFile(const std::string& path);

}  // namespace vesk
