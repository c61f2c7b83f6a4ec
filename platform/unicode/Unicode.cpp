#include "platform/unicode/Unicode.h"

#include <unicode/bytestream.h>
#include <unicode/casemap.h>
#include <unicode/stringpiece.h>
#include <unicode/utf16.h>
#include <unicode/utf8.h>

#include <algorithm>
#include <cstdint>
#include <limits>

#include "platform/text/ASCII.h"

namespace vesk {

namespace {

char lowerASCII(char c) noexcept { return c >= 'A' && c <= 'Z' ? static_cast<char>(c | 0x20) : c; }

std::string lowerASCII(std::string_view text) {
  std::string out(text);
  for (char& c : out) c = lowerASCII(c);
  return out;
}

// ICU uses 32-bit lengths. Longer text doesn't occur and is left unchanged.
bool isTooLongForICU(std::string_view text) {
  return text.size() > static_cast<std::size_t>(std::numeric_limits<std::int32_t>::max() / 4);
}

template <class Map>
std::string mapped(std::string_view text, Map map) {
  if (isASCII(text)) return lowerASCII(text);
  if (isTooLongForICU(text)) return std::string(text);
  std::string out;
  icu::StringByteSink<std::string> sink(&out, static_cast<std::int32_t>(text.size()));
  UErrorCode status = U_ZERO_ERROR;
  map(icu::StringPiece(text.data(), static_cast<std::int32_t>(text.size())), sink, status);
  return U_FAILURE(status) ? std::string(text) : out;
}

std::string folded(std::string_view text) {
  return mapped(text, [](icu::StringPiece piece, icu::ByteSink& sink, UErrorCode& status) {
    icu::CaseMap::utf8Fold(0, piece, sink, nullptr, status);
  });
}

}  // namespace

std::string lowercase(std::string_view text) {
  return mapped(text, [](icu::StringPiece piece, icu::ByteSink& sink, UErrorCode& status) {
    icu::CaseMap::utf8ToLower("", 0, piece, sink, nullptr, status);
  });
}

bool equalsIgnoringCase(std::string_view a, std::string_view b) {
  const std::size_t common = std::min(a.size(), b.size());
  for (std::size_t i = 0; i < common; ++i) {
    // Some characters outside ASCII fold to ASCII (U+212A to "k"), so the rest is compared after folding.
    if (!isASCII(a[i]) || !isASCII(b[i])) return folded(a.substr(i)) == folded(b.substr(i));
    if (a[i] != b[i] && lowerASCII(a[i]) != lowerASCII(b[i])) return false;
  }
  // No character folds to an empty string.
  return a.size() == b.size();
}

bool containsIgnoringCase(std::string_view text, std::string_view needle) {
  if (needle.empty()) return false;
  return folded(text).find(folded(needle)) != std::string::npos;
}

std::optional<std::string> utf8FromUTF16BE(std::string_view bytes) {
  if (bytes.size() % 2 != 0) return std::nullopt;
  const std::size_t count = bytes.size() / 2;
  auto unitAt = [&](std::size_t i) -> char16_t {
    return static_cast<char16_t>(static_cast<unsigned char>(bytes[2 * i]) << 8 |
                                 static_cast<unsigned char>(bytes[2 * i + 1]));
  };
  std::string text;
  text.reserve(bytes.size());
  for (std::size_t i = 0; i < count; ++i) {
    UChar32 character = unitAt(i);
    if (U16_IS_SURROGATE(character)) {
      if (!U16_IS_LEAD(character) || i + 1 == count || !U16_IS_TRAIL(unitAt(i + 1))) return std::nullopt;
      character = U16_GET_SUPPLEMENTARY(character, unitAt(++i));
    }
    char encoded[U8_MAX_LENGTH];
    std::int32_t length = 0;
    U8_APPEND_UNSAFE(encoded, length, character);
    text.append(encoded, static_cast<std::size_t>(length));
  }
  return text;
}

std::optional<std::string> utf16BEFromUTF8(std::string_view text) {
  if (isTooLongForICU(text)) return std::nullopt;
  const auto size = static_cast<std::int32_t>(text.size());
  std::string bytes;
  bytes.reserve(2 * text.size());
  auto addUnit = [&](unsigned unit) {
    bytes += static_cast<char>(unit >> 8);
    bytes += static_cast<char>(unit & 0xFF);
  };
  for (std::int32_t at = 0; at < size;) {
    UChar32 character = 0;
    U8_NEXT(text.data(), at, size, character);
    if (character < 0) return std::nullopt;
    if (U_IS_BMP(character)) {
      addUnit(static_cast<unsigned>(character));
    } else {
      addUnit(static_cast<unsigned>(U16_LEAD(character)));
      addUnit(static_cast<unsigned>(U16_TRAIL(character)));
    }
  }
  return bytes;
}

}  // namespace vesk
