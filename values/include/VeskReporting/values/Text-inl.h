// The functions of Text.h.
#pragma once

#include <cstring>

#include "Text.h"

namespace vesk {

namespace detail {

inline std::shared_ptr<char[]> allocateText(std::size_t size) {
#ifdef __cpp_lib_smart_ptr_for_overwrite
  return std::make_shared_for_overwrite<char[]>(size);
#else
  return std::shared_ptr<char[]>(new char[size]);
#endif
}

}  // namespace detail

VESK_VALUES_INLINE Text::Text(std::string_view text) : _size(text.size()) {
  if (text.empty()) return;
  auto storage = detail::allocateText(text.size());
  std::memcpy(storage.get(), text.data(), text.size());
  _data = std::shared_ptr<const char>(storage, storage.get());
}

VESK_VALUES_INLINE Text TextArena::add(std::string_view text) {
  if (text.empty()) return {};
  if (text.size() > _chunkSize / 4) return Text(text);
  if (!_chunk || _used + text.size() > _chunkSize) {
    _chunk = detail::allocateText(_chunkSize);
    _used = 0;
  }
  char* at = _chunk.get() + _used;
  std::memcpy(at, text.data(), text.size());
  _used += text.size();
  return Text(std::shared_ptr<const char>(_chunk, at), text.size());
}

}  // namespace vesk
