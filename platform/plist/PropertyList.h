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
  std::size_t depth = 64;  ///< containers within containers; the root is the first
  /// Values and keys visited. A part of a binary list that is referred to from many places counts each time:
  /// whoever walks the value will meet it each time.
  std::size_t nodes = 100'000;
  std::size_t contentBytes = 16 << 20;  ///< bytes of texts and data visited, counted in the same way
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

/// Reads an XML or a binary property list, whichever `bytes` starts as. Never throws and never crashes on
/// anything: what is not well-formed, breaks a limit, or holds text that is not UTF-8 or has a NUL, is
/// refused as a whole. Entities are neither declared nor fetched. Integers keep their full range: -2^63 to
/// 2^64-1.
PropertyListOutcome parsePropertyList(std::string_view bytes,
                                      PropertyListFlavor flavor = PropertyListFlavor::Plain,
                                      const PropertyListLimits& limits = {});

/// `value` as XML property list, indented for people. Nothing when it holds what XML can't carry: the null
/// marker, a text that is not UTF-8 or has control characters, a date outside the years 1 to 9999 (or not
/// finite), or values nested deeper than 64. Dates are cut to whole seconds, which is all the format has.
std::optional<std::string> writeXMLPropertyList(const Value& value);

/// `value` as binary property list; equal texts are written once. Nothing for a text that is not UTF-8 or has
/// a NUL, or for values nested deeper than 64. The null marker is written as null.
std::optional<std::string> writeBinaryPropertyList(const Value& value,
                                                   PropertyListFlavor flavor = PropertyListFlavor::Plain);

}  // namespace vesk
