// A position in marshalled bytes. Private to platform/ipc.
#pragma once

#include <algorithm>
#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>

namespace vesk {

/// Reads the basic types with D-Bus's alignment, relative to the start of `bytes`. Every function returns
/// whether it found a complete, well-formed value; after a failure the position is unspecified.
class WireCursor {
 public:
  WireCursor(std::string_view bytes, bool isBigEndian) noexcept : _bytes(bytes), _swaps(isBigEndian) {}

  bool atEnd() const noexcept { return _at == _bytes.size(); }
  std::size_t position() const noexcept { return _at; }
  std::size_t left() const noexcept { return _bytes.size() - _at; }

  /// `to`: a power of 2. The padding must be zero.
  bool align(std::size_t to) noexcept {
    const std::size_t end = (_at + to - 1) & ~(to - 1);
    if (end > _bytes.size()) return false;
    char padding = '\0';
    for (; _at < end; ++_at) padding = static_cast<char>(padding | _bytes[_at]);
    return padding == '\0';
  }

  template <class Number>
  bool number(Number& out) noexcept {
    if (!align(sizeof out) || left() < sizeof out) return false;
    std::memcpy(&out, _bytes.data() + _at, sizeof out);
    if (_swaps) out = swapped(out);
    _at += sizeof out;
    return true;
  }

  /// The bytes of a text or an object path, unchecked except for the terminating NUL.
  bool text(std::string_view& out) noexcept {
    std::uint32_t size = 0;
    return number(size) && terminated(size, out);
  }
  /// The bytes of a signature, likewise.
  bool signature(std::string_view& out) noexcept {
    std::uint8_t size = 0;
    return number(size) && terminated(size, out);
  }
  bool bytes(std::size_t size, std::string_view& out) noexcept {
    if (left() < size) return false;
    out = _bytes.substr(_at, size);
    _at += size;
    return true;
  }

 private:
  template <class Number>
  static Number swapped(Number number) noexcept {
    auto raw = std::bit_cast<std::array<char, sizeof number>>(number);
    std::reverse(raw.begin(), raw.end());
    return std::bit_cast<Number>(raw);
  }
  bool terminated(std::size_t size, std::string_view& out) noexcept {
    if (left() <= size || _bytes[_at + size] != '\0') return false;
    out = _bytes.substr(_at, size);
    _at += size + 1;
    return true;
  }

  std::string_view _bytes;
  bool _swaps;
  std::size_t _at = 0;
};

}  // namespace vesk
