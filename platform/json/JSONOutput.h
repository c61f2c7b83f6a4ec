// Where RapidJSON's writers put their text; only for JSONWriter.cpp.
#pragma once

// The flags parameter of PrettyWriter itself does not compile in this version of the library.
#define RAPIDJSON_WRITE_DEFAULT_FLAGS kWriteValidateEncodingFlag
#include <rapidjson/prettywriter.h>
#include <rapidjson/writer.h>

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <utility>

namespace vesk {

/// Where the text goes: the string that the caller gets in the end. Its size runs ahead of what is written.
class JSONOutput {
 public:
  using Ch = char;

  explicit JSONOutput(std::size_t reserve) { grow(std::max<std::size_t>(reserve, 64)); }

  void Put(char c) { *Push(1) = c; }
  void PutUnsafe(char c) { *_at++ = c; }
  void Reserve(std::size_t count) {
    if (static_cast<std::size_t>(_end - _at) < count) grow(count);
  }
  void Flush() {}

  /// Room for `count` characters, which count as written; `Pop` takes unused ones back.
  char* Push(std::size_t count) {
    Reserve(count);
    return std::exchange(_at, _at + count);
  }
  void Pop(std::size_t count) { _at -= count; }

  /// Copies what has been reserved before.
  void appendUnsafe(const char* text, std::size_t size) {
    std::memcpy(_at, text, size);
    _at += size;
  }

  std::string take() {
    _text.resize(static_cast<std::size_t>(_at - _text.data()));
    return std::move(_text);
  }

 private:
  void grow(std::size_t count) {
    const std::size_t written = _at ? static_cast<std::size_t>(_at - _text.data()) : 0;
    _text.resize(std::max(written + count, 2 * _text.size()));
    _at = _text.data() + written;
    _end = _text.data() + _text.size();
  }

  std::string _text;
  char* _at = nullptr;
  char* _end = nullptr;
};

// RapidJSON finds these by argument and so reserves once a text instead of asking at every character.
inline void PutReserve(JSONOutput& output, std::size_t count) { output.Reserve(count); }
inline void PutUnsafe(JSONOutput& output, char c) { output.PutUnsafe(c); }

using CompactJSONWriter = rapidjson::Writer<JSONOutput>;
using PrettyJSONWriter = rapidjson::PrettyWriter<JSONOutput>;

inline bool isPlainInJSON(char c) {
  const auto byte = static_cast<unsigned char>(c);
  return byte >= 0x20 && byte < 0x80 && byte != '"' && byte != '\\';
}

inline bool areEightPlainInJSON(const char* text) {
  constexpr std::uint64_t kOnes = 0x0101010101010101u;
  constexpr std::uint64_t kHigh = 0x8080808080808080u;
  std::uint64_t eight;
  std::memcpy(&eight, text, sizeof eight);
  // A byte's high bit comes out set when that byte is a control character, a quote, a backslash, or not
  // ASCII.
  auto equals = [&](char c) {
    const std::uint64_t zeroWhereEqual = eight ^ (kOnes * static_cast<unsigned char>(c));
    return zeroWhereEqual - kOnes;
  };
  return (((eight - kOnes * 0x20) | equals('"') | equals('\\') | eight) & kHigh) == 0;
}

}  // namespace vesk

// The places that RapidJSON keeps for output streams that can do better than one character at a time, as its
// own string buffer does.
namespace rapidjson {

/// Copies up to the next character that needs a closer look; false at the end of the text.
template <>
inline bool vesk::CompactJSONWriter::ScanWriteUnescapedString(StringStream& text, std::size_t length) {
  const char* const end = text.head_ + length;
  const char* plainEnd = text.src_;
  while (end - plainEnd >= 8 && vesk::areEightPlainInJSON(plainEnd)) plainEnd += 8;
  while (plainEnd != end && vesk::isPlainInJSON(*plainEnd)) ++plainEnd;
  os_->appendUnsafe(text.src_, static_cast<std::size_t>(plainEnd - text.src_));
  text.src_ = plainEnd;
  return plainEnd != end;
}

template <>
inline bool vesk::CompactJSONWriter::WriteInt64(std::int64_t number) {
  char* const start = os_->Push(21);
  os_->Pop(static_cast<std::size_t>(start + 21 - internal::i64toa(number, start)));
  return true;
}

template <>
inline bool vesk::CompactJSONWriter::WriteUint64(std::uint64_t number) {
  char* const start = os_->Push(20);
  os_->Pop(static_cast<std::size_t>(start + 20 - internal::u64toa(number, start)));
  return true;
}

template <>
inline bool vesk::CompactJSONWriter::WriteDouble(double number) {
  if (!std::isfinite(number)) return false;
  char* const start = os_->Push(25);
  os_->Pop(static_cast<std::size_t>(start + 25 - internal::dtoa(number, start, maxDecimalPlaces_)));
  return true;
}

}  // namespace rapidjson
