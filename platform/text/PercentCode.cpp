#include "platform/text/PercentCode.h"

namespace vesk {

namespace {

int hexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

}  // namespace

std::string percentEncoded(std::string_view text, std::string_view others) {
  constexpr char kDigits[] = "0123456789ABCDEF";
  std::string encoded;
  for (char c : text) {
    if (kUnreserved.find(c) != std::string_view::npos || others.find(c) != std::string_view::npos) {
      encoded += c;
    } else {
      auto byte = static_cast<unsigned char>(c);
      encoded += {'%', kDigits[byte >> 4], kDigits[byte & 15]};
    }
  }
  return encoded;
}

std::optional<std::string> percentDecoded(std::string_view text) {
  std::string decoded;
  for (std::size_t i = 0; i < text.size(); ++i) {
    int high = text[i] == '%' && i + 2 < text.size() ? hexDigit(text[i + 1]) : -1;
    int low = high >= 0 ? hexDigit(text[i + 2]) : -1;
    char c = low >= 0 ? static_cast<char>(high * 16 + low) : text[i];
    if (low >= 0) i += 2;
    if (c == '\0') return std::nullopt;
    decoded += c;
  }
  return decoded;
}

}  // namespace vesk
