// Parses payloads written by people and scripts.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// A value, or a readable reason why there is none.
template <class T>
struct Parsed {
  std::optional<T> value;
  std::string error;
};

/// Parses one JSON value. Refuses what a message can't contain: a NUL in text, a number out of range, nesting
/// deeper than 32.
Parsed<Value> parsePayloadValue(std::string_view json);

/// Like `parsePayloadValue`, but the value must be an object.
Parsed<Dictionary> parsePayloadObject(std::string_view json);

/// Parses `key=text` and `key:=json` arguments, in order. Keys must be unique.
Parsed<Dictionary> parsePairs(const std::vector<std::string>& arguments);

}  // namespace vesk
