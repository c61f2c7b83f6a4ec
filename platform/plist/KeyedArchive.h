// Keyed archives: a graph of objects with their classes, as a binary property list (docs/keyed-archive.md).
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// What stands under "$archiver".
inline constexpr std::string_view kKeyedArchiver = "VeskKeyedArchiver";
inline constexpr std::int64_t kKeyedArchiveVersion = 100'000;

/// `root` as archive. Equal texts, and lists and dictionaries that are shared, are archived once. Nothing for
/// a text that is not UTF-8 or has a NUL, or for values nested deeper than 64.
std::optional<std::string> archiveValue(const Value& root);

}  // namespace vesk
