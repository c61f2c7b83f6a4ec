// Caseless text, by the Unicode mappings of the root locale.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// Full lower-case mapping (one character may become several). Bytes that are no UTF-8 stay as they are.
std::string lowercase(std::string_view text);

/// Equal by full case folding ("STRASSE" equals "straße"). Texts that differ in their ASCII part are told
/// apart without a look at the rest, so that this may be called for every key of every event.
bool equalsIgnoringCase(std::string_view a, std::string_view b);

/// `needle` occurs in `text`, both case-folded. An empty needle never occurs.
bool containsIgnoringCase(std::string_view text, std::string_view needle);

/// Between UTF-8 and UTF-16 in big-endian bytes; nothing for what is not well-formed.
std::optional<std::string> utf8FromUTF16BE(std::string_view bytes);
std::optional<std::string> utf16BEFromUTF8(std::string_view text);

}  // namespace vesk
