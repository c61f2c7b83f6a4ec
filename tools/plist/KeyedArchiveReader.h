// Reads keyed archives (docs/keyed-archive.md).
#pragma once

#include <string_view>

#include "platform/plist/PropertyList.h"

namespace vesk {

/// The root of an archive, or one clause that says what is wrong. The bytes may come from anywhere: they are
/// read under the limits, where an object counts at every reference to it, and refused as a whole when
/// anything in them is wrong, such as a reference to no object or an unknown class.
PropertyListOutcome unarchiveValue(std::string_view archive, const PropertyListLimits& limits = {});

}  // namespace vesk
