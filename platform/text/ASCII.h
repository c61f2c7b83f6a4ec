// Text of protocols and files, in ASCII regardless of the locale.
#pragma once

#include <span>
#include <string>
#include <string_view>

namespace vesk {

inline bool isASCII(char c) noexcept { return static_cast<unsigned char>(c) < 0x80; }
bool isASCII(std::string_view text) noexcept;

inline bool isControl(char c) noexcept { return static_cast<unsigned char>(c) < 0x20 || c == 0x7f; }

/// Removes spaces, tabs and line ends from both ends.
std::string_view trimmed(std::string_view text) noexcept;

/// Whether the two differ at most in the case of ASCII letters.
bool equalsIgnoringASCIICase(std::string_view a, std::string_view b) noexcept;

/// Two lower-case hexadecimal digits per byte.
std::string hexLower(std::span<const unsigned char> bytes);

}  // namespace vesk
