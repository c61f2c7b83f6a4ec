// Reads and shows keyed archives (docs/keyed-archive.md).
#pragma once

#include <string>
#include <string_view>

#include "platform/plist/PropertyList.h"

namespace vesk {

/// Returns the root of an archive, or an error. The bytes may be untrusted: the limits apply, counting an
/// object once per reference, and any fault, such as a dangling reference or an unknown class, refuses the
/// whole archive.
Result<Value> unarchiveValue(std::string_view archive, const PropertyListLimits& limits = {});

/// Limits on the archives that the tools read.
PropertyListLimits archiveLimits();

/// The archived value with one line for each item or entry and the contents of containers indented. Ends with
/// a line feed. Throws std::runtime_error with a description of the archive's fault.
std::string archiveText(std::string_view archive);

}  // namespace vesk
