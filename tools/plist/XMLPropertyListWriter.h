// Writes XML property lists.
#pragma once

#include <optional>
#include <string>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// Returns `value` as an indented XML property list. Returns nullopt if XML can't represent it: the null
/// marker, text that is not UTF-8 or has control characters, a date outside the years 1 to 9999 (or not
/// finite), or nesting deeper than 64. Dates are truncated to whole seconds, as the format requires.
std::optional<std::string> writeXMLPropertyList(const Value& value);

}  // namespace vesk
