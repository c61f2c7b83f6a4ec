// Numbers and dates in XML property lists.
#pragma once

#include <optional>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// Decimal or, after "0x", hexadecimal; surrounding white space is skipped. The result is signed if it fits,
/// otherwise unsigned. Returns nullopt outside -2^63 to 2^64-1.
std::optional<Value> integerFromPropertyListText(std::string_view text);
/// A decimal number, "nan" or an infinity.
std::optional<double> realFromPropertyListText(std::string_view text);
/// "2026-11-24T20:31:29Z".
std::optional<Date> dateFromPropertyListText(std::string_view text);

}  // namespace vesk
