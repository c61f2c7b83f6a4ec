// UTF-8 validation and truncation.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>

namespace vesk {

/// Whether `text` is well-formed UTF-8: no overlong forms, no surrogates, nothing above U+10FFFF, and no NUL
/// unless `allowNUL`. Inline because every text of every message is checked.
inline bool isValidUTF8(std::string_view text, bool allowNUL = true) noexcept {
  const auto* at = reinterpret_cast<const unsigned char*>(text.data());
  const auto* end = at + text.size();
  while (at < end) {
    if (end - at >= 8) {
      std::uint64_t eight;
      std::memcpy(&eight, at, sizeof eight);
      // All eight are ASCII and, unless allowed, none is NUL: subtracting 1 from a NUL sets its high bit.
      const std::uint64_t borrowed = allowNUL ? 0 : eight - 0x0101010101010101U;
      if (((eight | borrowed) & 0x8080808080808080U) == 0) {
        at += 8;
        continue;
      }
    }
    unsigned char lead = *at++;
    if (lead == 0 && !allowNUL) return false;
    if (lead < 0x80) continue;
    int more = lead >= 0xF0 ? 3 : lead >= 0xE0 ? 2 : 1;
    if (lead < 0xC2 || lead > 0xF4 || end - at < more) return false;
    // The second byte reveals overlong forms, surrogates and values above U+10FFFF.
    unsigned char low = lead == 0xE0 ? 0xA0 : lead == 0xF0 ? 0x90 : 0x80;
    unsigned char high = lead == 0xED ? 0x9F : lead == 0xF4 ? 0x8F : 0xBF;
    if (*at < low || *at > high) return false;
    for (int i = 1; i < more; ++i) {
      if ((at[i] & 0xC0) != 0x80) return false;
    }
    at += more;
  }
  return true;
}

/// The longest prefix of at most `size` bytes that doesn't split a UTF-8 character. For text to be shown.
inline std::string cutToWholeCharacters(std::string_view text, std::size_t size) {
  if (text.size() <= size) return std::string(text);
  for (int i = 0; i < 3 && size > 0 && (static_cast<unsigned char>(text[size]) & 0xC0) == 0x80; ++i) --size;
  return std::string(text.substr(0, size));
}

}  // namespace vesk
