// Creates files for the program's own use.
#pragma once

#include <string>

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// Creates a file at `path` with mode 0600, opened for reading and writing. Fails with EEXIST if something
/// exists there. If root creates it, it belongs to the directory's owner, since that user needs it later.
/// Returns an empty descriptor, with errno set, on failure.
[[nodiscard]] FileDescriptor makePrivateFile(const std::string& path);

}  // namespace vesk
