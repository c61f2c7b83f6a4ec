// Keyed archives: a graph of objects with their classes, as a binary property list (docs/keyed-archive.md).
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "platform/plist/PropertyList.h"

namespace vesk {

/// What stands under "$archiver".
inline constexpr std::string_view kKeyedArchiver = "VeskKeyedArchiver";
inline constexpr std::int64_t kKeyedArchiveVersion = 100'000;

/// `root` as archive. Equal texts, and lists and dictionaries that are shared, are archived once. Nothing for
/// a text that is not UTF-8 or has a NUL, or for values nested deeper than 64.
std::optional<std::string> archiveValue(const Value& root);

/// The root of an archive, or one clause that says what is wrong. Bytes from anywhere: under the limits (an
/// object counts wherever it is referred to), and refused as a whole when anything in it is not as it should
/// be, as an object that holds itself or one of an unknown class. What the archive shares is shared again.
PropertyListOutcome unarchiveValue(std::string_view archive, const PropertyListLimits& limits = {});

}  // namespace vesk
