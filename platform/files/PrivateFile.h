// Files that a program makes for itself.
#pragma once

#include <string>

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// Makes a file at `path`, where nothing may stand yet (EEXIST), of mode 0600 and open for reading and
/// writing. Root may come before the user whose directory it is, so what root makes belongs to the
/// directory's owner. None, with errno.
[[nodiscard]] FileDescriptor makePrivateFile(const std::string& path);

}  // namespace vesk
