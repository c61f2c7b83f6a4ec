// Creates files for the program's own use.
#pragma once

#include <string>
#include <string_view>

#include "platform/files/FileDescriptor.h"
#include "platform/result/Result.h"

namespace vesk {

/// Creates a file at `path` with mode 0600, opened for reading and writing. The error's kind is Exists if
/// something is there. If root creates it, it belongs to the directory's owner, since that user needs it
/// later.
Result<FileDescriptor> makePrivateFile(const std::string& path);

/// Writes such a file, in place of an earlier one at `path`, as a whole or not at all, also if the power
/// fails. One process at a time may replace a file.
Result<void> replacePrivateFile(const std::string& path, std::string_view bytes);

}  // namespace vesk
