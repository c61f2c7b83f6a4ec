// Property lists, the format of storebags. Untrusted input is read under hard limits.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "platform/result/Result.h"

namespace vesk {

/// Limits on the cost of a document.
struct PropertyListLimits {
  std::size_t bytes = 1 << 20;
  std::size_t depth = 64;               ///< containers within containers; the root counts as the first
  std::size_t nodes = 100'000;          ///< values and keys; a shared object counts once per reference
  std::size_t contentBytes = 16 << 20;  ///< of texts and data, counted in the same way
};

enum class PropertyListFlavor {
  Plain,
  /// Keyed archives refer to their objects by UIDs, which plain property lists do not have. A UID is read and
  /// written as a dictionary with one entry, "CF$UID", an unsigned integer.
  KeyedArchive
};

/// Reads an XML or a binary property list, depending on how `bytes` starts, and returns its root. Refuses the
/// whole document if it is malformed, exceeds a limit, or contains text that is not UTF-8 or has a NUL.
/// Entities are neither declared nor fetched. Integers keep their full range: -2^63 to 2^64-1.
Result<Value> parsePropertyList(std::string_view bytes, PropertyListFlavor flavor = PropertyListFlavor::Plain,
                                const PropertyListLimits& limits = {});

/// Returns `value` as a binary property list, with equal texts written once. Returns nullopt for text that is
/// not UTF-8 or has a NUL, or for nesting deeper than 64. The null marker is written as null.
std::optional<std::string> writeBinaryPropertyList(const Value& value,
                                                   PropertyListFlavor flavor = PropertyListFlavor::Plain);

}  // namespace vesk
