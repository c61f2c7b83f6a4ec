// Percent-encoding.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// Encodes all bytes of `text` as %XX, except letters, digits, "-._~" and the characters in `others`.
std::string percentEncoded(std::string_view text, std::string_view others);

/// Decodes each %XX in `text` and keeps everything else. Returns nullopt if a decoded byte is NUL.
std::optional<std::string> percentDecoded(std::string_view text);

}  // namespace vesk
