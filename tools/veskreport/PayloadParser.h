// What people and scripts write as payloads, turned into values that can be sent.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// A value, or why there is none in words for the person who wrote it.
template <class T>
struct Parsed {
  std::optional<T> value;
  std::string error;
};

/// One JSON value. Refused is what no message can carry: a NUL in a text, a number out of range, anything
/// nested deeper than 32.
Parsed<Value> parsePayloadValue(std::string_view json);

/// The same, but it has to be an object.
Parsed<Dictionary> parsePayloadObject(std::string_view json);

/// `key=text` and `key:=json` arguments, in their order; each key once.
Parsed<Dictionary> parsePairs(const std::vector<std::string>& arguments);

}  // namespace vesk
