// Reading JSON, for the tools.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// A value, or what is wrong with the text (with line and column).
struct JSONOutcome {
  std::optional<Value> value;
  std::string error;
};

/// Reads one JSON value and nothing else but white space; arrays and objects may nest `depth` deep. Integers
/// become signed ones where they fit, null becomes the null marker; objects keep their order, and a key that
/// is repeated has its last value. Never throws on anything in `text`.
JSONOutcome parseJSON(std::string_view text, std::size_t depth = 32);

}  // namespace vesk
