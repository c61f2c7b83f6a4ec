// Case-insensitive text, by the Unicode mappings of the root locale.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// Full lower-case mapping, where one character may become several. Text that is not UTF-8 stays unchanged.
std::string lowercase(std::string_view text);

/// Equal after full case folding ("STRASSE" equals "straße"). If the leading ASCII parts differ, the rest is
/// not looked at, so that this is fast enough for every key of every event.
bool equalsIgnoringCase(std::string_view a, std::string_view b);

/// Whether `needle` occurs in `text`, both case-folded. An empty needle never occurs.
bool containsIgnoringCase(std::string_view text, std::string_view needle);

/// Conversions between UTF-8 and big-endian UTF-16; nullopt if the input is not well-formed.
std::optional<std::string> utf8FromUTF16BE(std::string_view bytes);
std::optional<std::string> utf16BEFromUTF8(std::string_view text);

}  // namespace vesk
