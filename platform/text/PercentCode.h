// Percent-encoding.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// Characters that mean nothing special anywhere in a URL.
inline constexpr std::string_view kUnreserved =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-._~";

/// Encodes all bytes of `text` as %XX, except the unreserved ones and the characters in `others`.
std::string percentEncoded(std::string_view text, std::string_view others);

/// Decodes each %XX in `text` and keeps everything else. Returns nullopt if a decoded byte is NUL.
std::optional<std::string> percentDecoded(std::string_view text);

}  // namespace vesk
