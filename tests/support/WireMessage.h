// Calls to the daemon, byte by byte.
#pragma once

#include <string>
#include <string_view>

#include "protocol/WireNames.h"

namespace vesk::test {

/// Bytes of a message in either byte order.
class Marshalled {
 public:
  explicit Marshalled(bool bigEndian) : _bigEndian(bigEndian) {}

  void number(std::uint32_t value) {
    align(4);
    for (int i = 0; i < 4; ++i) _bytes += static_cast<char>(value >> (_bigEndian ? 24 - 8 * i : 8 * i));
  }
  void text(std::string_view value) {
    number(static_cast<std::uint32_t>(value.size()));
    _bytes.append(value).append(1, '\0');
  }
  void signature(std::string_view value) {
    _bytes.append(1, static_cast<char>(value.size())).append(value).append(1, '\0');
  }
  void raw(std::string_view value) { _bytes += value; }
  void align(std::size_t to) { _bytes.resize((_bytes.size() + to - 1) / to * to); }
  void field(char code, const char* type, std::string_view value) {
    align(8);
    _bytes += code;
    signature(type);
    *type == 'g' ? signature(value) : text(value);
  }
  std::string take() { return std::move(_bytes); }

 private:
  const bool _bigEndian;
  std::string _bytes;
};

struct WireHeader {
  bool bigEndian = false;
  std::uint32_t descriptors = 0;
};

/// A message that begins with the four bytes of `start`.
inline std::string wholeMessage(std::string_view start, const std::string& fields, const std::string& body) {
  Marshalled whole(start[0] == 'B');
  whole.raw(start);
  whole.number(static_cast<std::uint32_t>(body.size()));
  whole.number(1);
  whole.number(static_cast<std::uint32_t>(fields.size()));
  whole.raw(fields);
  whole.align(8);
  whole.raw(body);
  return whole.take();
}

/// A one-way call in wire format.
inline std::string wireMessage(const char* member, const std::string& signature, const std::string& body,
                               WireHeader header = {}) {
  using namespace std::string_view_literals;
  Marshalled fields(header.bigEndian);
  fields.field(1, "o", wire::kObjectPath);
  fields.field(2, "s", wire::kSessionInterface);
  fields.field(3, "s", member);
  fields.field(8, "g", signature);
  if (header.descriptors > 0) {
    fields.align(8);
    fields.raw("\x09\1u\0"sv);
    fields.number(header.descriptors);
  }
  // One-way; version 1.
  return wholeMessage(header.bigEndian ? "B\1\1\1"sv : "l\1\1\1"sv, fields.take(), body);
}

}  // namespace vesk::test
