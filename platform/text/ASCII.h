// Text of protocols and files, whose letters are those of ASCII whatever the locale says.
#pragma once

#include <span>
#include <string>
#include <string_view>

namespace vesk {

/// Without spaces, tabs and line ends at either end.
std::string_view trimmed(std::string_view text) noexcept;

/// Whether the two are alike but for the case of ASCII letters.
bool equalsIgnoringASCIICase(std::string_view a, std::string_view b) noexcept;

/// Two lower-case hexadecimal digits a byte, in order.
std::string hexLower(std::span<const unsigned char> bytes);

}  // namespace vesk
