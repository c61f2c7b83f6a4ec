// Base64 in the standard alphabet, with padding.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// Without line breaks.
std::string base64Encode(std::string_view bytes);

/// Skips characters that are neither in the alphabet nor "=" (line breaks, blanks). Returns nullopt if the
/// rest is not base64: its length is not a multiple of four, or a "=" occurs before the last two characters.
/// Text without any character of the alphabet gives zero bytes.
std::optional<std::string> base64Decode(std::string_view text);

}  // namespace vesk
