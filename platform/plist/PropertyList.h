// Property lists: what storebags are written in. Bytes from outside are read under hard limits.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// What a document may cost at most.
struct PropertyListLimits {
  std::size_t bytes = 1 << 20;
  std::size_t depth = 64;       ///< containers within containers; the root is the first
  std::size_t nodes = 100'000;  ///< values and keys; what is referred to from many places counts each time
  std::size_t contentBytes = 16 << 20;  ///< of texts and data, counted in the same way
};

enum class PropertyListFlavor {
  Plain,
  /// Keyed archives refer to their objects by UIDs, which plain property lists do not have. A UID reads as a
  /// dictionary of one entry, "CF$UID", with an unsigned integer; it is written in that form too.
  KeyedArchive
};

/// The root value, or one clause that says what is wrong.
struct PropertyListOutcome {
  std::optional<Value> value;
  std::string error;
};

/// Reads an XML or a binary property list, whichever `bytes` starts as. Refuses the whole document when it is
/// not well-formed, passes a limit, or holds text that is not UTF-8 or has a NUL. Entities are neither
/// declared nor fetched. Integers keep their full range: -2^63 to 2^64-1.
PropertyListOutcome parsePropertyList(std::string_view bytes,
                                      PropertyListFlavor flavor = PropertyListFlavor::Plain,
                                      const PropertyListLimits& limits = {});

/// `value` as binary property list; equal texts are written once. Nothing for a text that is not UTF-8 or has
/// a NUL, or for values nested deeper than 64. The null marker is written as null.
std::optional<std::string> writeBinaryPropertyList(const Value& value,
                                                   PropertyListFlavor flavor = PropertyListFlavor::Plain);

}  // namespace vesk
