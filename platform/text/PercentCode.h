// Bytes in URLs.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// `text` with %XX for each byte but letters, digits, "-._~" and the characters in `others`.
std::string percentEncoded(std::string_view text, std::string_view others);

/// `text` with its %XX decoded; nothing when one of them is NUL. What is no %XX stays as it is.
std::optional<std::string> percentDecoded(std::string_view text);

}  // namespace vesk
