// Immutable UTF-8 text that is cheap to copy.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

// Programs get the functions of values inline; this project compiles them once.
#ifdef VESK_VALUES_COMPILED
#define VESK_VALUES_INLINE
#else
#define VESK_VALUES_INLINE inline
#endif

namespace vesk {

/// Text that shares its bytes with its copies. Copying costs a reference count, or nothing for a literal. The
/// bytes never change, so any thread may read any copy. Text from a decoder (wire, property list, TOML) is
/// valid UTF-8; the class itself does not check.
class Text {
 public:
  Text() noexcept = default;

  /// Copies `text` into storage of its own.
  // NOLINTNEXTLINE(google-explicit-constructor): texts are written as literals everywhere
  Text(std::string_view text);
  Text(const std::string& text) : Text(std::string_view(text)) {}
  /// A null pointer gives an empty text.
  Text(const char* text) : Text(std::string_view(text ? text : "")) {}

  /// Refers to characters of static storage duration, without a copy or a reference count.
  template <std::size_t N>
  static Text literal(const char (&text)[N]) noexcept {
    return Text(std::shared_ptr<const char>(std::shared_ptr<const char>(), text), N - 1);
  }

  /// Refers to `size` bytes at `data` and shares ownership of them.
  Text(std::shared_ptr<const char> data, std::size_t size) noexcept : _data(std::move(data)), _size(size) {}

  std::string_view view() const noexcept { return {_data ? _data.get() : "", _size}; }
  std::string string() const { return std::string(view()); }
  std::size_t size() const noexcept { return _size; }
  bool empty() const noexcept { return _size == 0; }

  friend bool operator==(const Text& a, const Text& b) noexcept {
    return a._size == b._size && (a._data.get() == b._data.get() || a.view() == b.view());
  }
  friend bool operator==(const Text& a, std::string_view b) noexcept { return a.view() == b; }
  friend bool operator==(const Text& a, const char* b) noexcept { return a.view() == (b ? b : ""); }

 private:
  std::shared_ptr<const char> _data;
  std::size_t _size = 0;
};

/// Creates many texts with few allocations. A decoder uses one arena per message. A chunk lives as long as
/// any text in it. The arena is not thread-safe; its texts are.
class TextArena {
 public:
  /// `chunkSize`: bytes per allocation. Text longer than a quarter of it gets its own allocation.
  explicit TextArena(std::size_t chunkSize = 1024) noexcept : _chunkSize(chunkSize) {}
  Text add(std::string_view text);

 private:
  std::size_t _chunkSize;
  std::shared_ptr<char[]> _chunk;
  std::size_t _used = 0;
};

}  // namespace vesk

template <>
struct std::hash<vesk::Text> {
  std::size_t operator()(const vesk::Text& text) const noexcept {
    return std::hash<std::string_view>{}(text.view());
  }
};

#ifndef VESK_VALUES_COMPILED
#include "Text-inl.h"
#endif
