// Values read as values of another kind.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// As text: a text unchanged, a number as decimal text (booleans are 1 and 0), nothing for any other kind.
std::optional<std::string> stringForm(const Value& value);

/// As integer: a number as such, a text by its leading integer, 0 for any other kind. The result holds to the
/// range of 64 bits.
std::int64_t integerForm(const Value& value);

/// The decimal integer at the start of `text`, behind white space and a sign; 0 when there is none. Held
/// inside the range of 64 bits.
std::int64_t leadingInteger(std::string_view text) noexcept;

/// -1 for what is NaN or infinite, else `value`: JSON has no other numbers.
double finiteOrMinusOne(double value) noexcept;

}  // namespace vesk
