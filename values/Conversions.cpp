#include "values/Conversions.h"

#include <algorithm>
#include <charconv>
#include <cmath>

namespace vesk {

namespace {

// Uses an exponent only for very large or small numbers, so that reading 100000 as an integer doesn't give 1.
std::string decimal(double number) {
  const double size = std::abs(number);
  const bool isPlain = size == 0 || (size >= 1e-4 && size < 1e16);
  char digits[64];
  auto [end, error] = std::to_chars(digits, digits + sizeof digits, number,
                                    isPlain ? std::chars_format::fixed : std::chars_format::scientific);
  return error == std::errc{} ? std::string(digits, end) : std::string();
}

}  // namespace

std::int64_t leadingInteger(std::string_view text) noexcept {
  text.remove_prefix(std::min(text.find_first_not_of(" \t\n\v\f\r"), text.size()));
  if (text.size() > 1 && text[0] == '+' && text[1] != '-') text.remove_prefix(1);
  std::int64_t number = 0;
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error == std::errc::result_out_of_range) return text[0] == '-' ? INT64_MIN : INT64_MAX;
  return number;
}

std::optional<std::string> stringForm(const Value& value) {
  if (const Text* text = value.text()) return text->string();
  if (const double* number = value.real()) return decimal(*number);
  if (const auto* number = value.unsignedInteger()) return std::to_string(*number);
  const auto number = value.asInteger();
  return number ? std::optional(std::to_string(*number)) : std::nullopt;
}

std::int64_t integerForm(const Value& value) {
  if (const Text* text = value.text()) return leadingInteger(text->view());
  return value.asInteger().value_or(0);
}

double finiteOrMinusOne(double value) noexcept { return std::isfinite(value) ? value : -1.0; }

}  // namespace vesk
