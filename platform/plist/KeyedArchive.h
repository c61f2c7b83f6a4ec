// Keyed archives: a graph of objects with their classes, as a binary property list (docs/keyed-archive.md).
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// The value of "$archiver".
inline constexpr std::string_view kKeyedArchiver = "VeskKeyedArchiver";
inline constexpr std::int64_t kKeyedArchiveVersion = 100'000;

/// Returns `root` as an archive. Equal texts, and shared lists and dictionaries, are archived once. Returns
/// nullopt for text that is not UTF-8 or has a NUL, or for nesting deeper than 64.
std::optional<std::string> archiveValue(const Value& root);

}  // namespace vesk
