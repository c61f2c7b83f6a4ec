// Keyed archives for a person to read.
#pragma once

#include <string>
#include <string_view>

#include "platform/plist/KeyedArchive.h"

namespace vesk {

/// What the tools read at most.
PropertyListLimits archiveLimits();

/// The archived value, one line an item or entry, those of a container indented below it; ends with a line
/// feed. Throws std::runtime_error that says what is wrong with the archive.
std::string archiveText(std::string_view archive);

}  // namespace vesk
