// Conversions between kinds of values.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// Text unchanged, numbers as decimal text (booleans as 1 and 0); nullopt for any other kind.
std::optional<std::string> stringForm(const Value& value);

/// Numbers as integers, text by its leading integer, 0 for any other kind. Saturates at the range of 64 bits.
std::int64_t integerForm(const Value& value);

/// The decimal integer at the start of `text`, after optional white space and sign; 0 if there is none.
/// Saturates at the range of 64 bits.
std::int64_t leadingInteger(std::string_view text) noexcept;

/// Replaces NaN and infinity by -1, since JSON can't represent them.
double finiteOrMinusOne(double value) noexcept;

}  // namespace vesk
