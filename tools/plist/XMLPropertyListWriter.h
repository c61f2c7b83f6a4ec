// Writes XML property lists.
#pragma once

#include <optional>
#include <string>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// `value` as XML property list, indented for people. Returns nothing when it holds something that XML can't
/// carry: the null marker, a text that is not UTF-8 or has control characters, a date outside the years 1 to
/// 9999 (or not finite), or values nested deeper than 64. Dates are cut to whole seconds, which is all the
/// format has.
std::optional<std::string> writeXMLPropertyList(const Value& value);

}  // namespace vesk
