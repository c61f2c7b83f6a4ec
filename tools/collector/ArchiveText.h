// Readable text for keyed archives.
#pragma once

#include <string>
#include <string_view>

#include "tools/plist/KeyedArchiveReader.h"

namespace vesk {

/// Limits on the archives that the tools read.
PropertyListLimits archiveLimits();

/// The archived value with one line for each item or entry and the contents of containers indented. Ends with
/// a line feed. Throws std::runtime_error with a description of the archive's fault.
std::string archiveText(std::string_view archive);

}  // namespace vesk
