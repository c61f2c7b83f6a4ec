// Reads keyed archives (docs/keyed-archive.md).
#pragma once

#include <string_view>

#include "platform/plist/PropertyList.h"

namespace vesk {

/// Returns the root of an archive, or an error. The bytes may be untrusted: the limits apply, counting an
/// object once per reference, and any fault, such as a dangling reference or an unknown class, refuses the
/// whole archive.
Result<Value> unarchiveValue(std::string_view archive, const PropertyListLimits& limits = {});

}  // namespace vesk
