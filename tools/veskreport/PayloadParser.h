// Parses payloads written by people and scripts.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "platform/result/Result.h"

namespace vesk {

/// Parses one JSON value. Refuses what a message can't contain: a NUL in text, a number out of range, nesting
/// deeper than 32.
Result<Value> parsePayloadValue(std::string_view json);

/// Like `parsePayloadValue`, but the value must be an object.
Result<Dictionary> parsePayloadObject(std::string_view json);

/// Parses `key=text` and `key:=json` arguments, in order. Keys must be unique.
Result<Dictionary> parsePairs(const std::vector<std::string>& arguments);

}  // namespace vesk
