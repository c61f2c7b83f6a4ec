#include "platform/text/ASCII.h"

#include <algorithm>
#include <cstdint>
#include <cstring>

namespace vesk {

namespace {

char lower(char c) noexcept { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; }

}  // namespace

bool isASCII(std::string_view text) noexcept {
  std::size_t i = 0;
  for (; i + 8 <= text.size(); i += 8) {
    std::uint64_t eight;
    std::memcpy(&eight, text.data() + i, 8);
    if (eight & 0x8080808080808080u) return false;
  }
  for (; i < text.size(); ++i) {
    if (!isASCII(text[i])) return false;
  }
  return true;
}

std::string_view trimmed(std::string_view text) noexcept {
  constexpr std::string_view kBlank = " \t\r\n";
  const std::size_t first = text.find_first_not_of(kBlank);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(kBlank) - first + 1);
}

bool equalsIgnoringASCIICase(std::string_view a, std::string_view b) noexcept {
  return std::equal(a.begin(), a.end(), b.begin(), b.end(),
                    [](char x, char y) { return lower(x) == lower(y); });
}

std::string hexLower(std::span<const unsigned char> bytes) {
  static constexpr char kDigits[] = "0123456789abcdef";
  std::string text(bytes.size() * 2, '\0');
  char* out = text.data();
  for (unsigned char byte : bytes) {
    *out++ = kDigits[byte >> 4];
    *out++ = kDigits[byte & 15];
  }
  return text;
}

}  // namespace vesk
