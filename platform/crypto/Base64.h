// Base64 in the standard alphabet, with padding.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// Without line breaks.
std::string base64Encode(std::string_view bytes);

/// Skips every character that is neither in the alphabet nor "=" (line breaks, blanks). Nothing when what
/// remains is no base64: its length is no multiple of four, or a "=" stands elsewhere than among the last
/// two. Text without any character of the alphabet is zero bytes.
std::optional<std::string> base64Decode(std::string_view text);

}  // namespace vesk
