#include "platform/json/JSONWriter.h"

#include <gtest/gtest.h>

#include <boost/json.hpp>
#include <cmath>
#include <limits>

namespace vesk {
namespace {

std::string compact(const Value& value) { return toJSON(value, JSONStyle::Compact).value_or("(nothing)"); }

Value nested(std::size_t depth) {
  Value value = List{};
  for (std::size_t i = 1; i < depth; ++i)
    value = i % 2 ? Value(Dictionary{{"k", value}}) : Value(List{value});
  return value;
}

TEST(JSON, WritesEveryKindOfValue) {
  const struct {
    Value value;
    const char* text;
  } cases[] = {
      {Value(), "null"},
      {true, "true"},
      {-5, "-5"},
      {std::numeric_limits<std::int64_t>::min(), "-9223372036854775808"},
      {std::numeric_limits<std::uint64_t>::max(), "18446744073709551615"},
      {0.1, "0.1"},
      {3.0, "3.0"},
      {1e-6, "0.000001"},
      {-1e-7, "-1e-07"},
      {1e20, "100000000000000000000.0"},
      {1e21, "1e+21"},
      {1764016289.123456, "1764016289.123456"},
      {Date{1764016289.000001}, "1764016289.000001"},
      {"back\\slash and tab\t", R"("back\\slash and tab\t")"},
      {std::string("\x00\x1f\x7f", 3), "\"\\u0000\\u001F\x7f\""},
      {"äöü → 🎉 and more ASCII after it", "\"äöü → 🎉 and more ASCII after it\""},
      {"\uFDD0\uFFFE\uFFFF\U0010FFFF", "\"\uFDD0\uFFFE\uFFFF\U0010FFFF\""},  // valid, though not characters
      {Dictionary{{"a", List{1, "b", Value()}}, {"c", Dictionary{{"d", 2u}}}},
       R"({"a":[1,"b",null],"c":{"d":2}})"},
  };
  for (const auto& c : cases) EXPECT_EQ(compact(c.value), c.text);
}

TEST(JSON, RefusesWhatItCannotCarry) {
  const Value cases[] = {
      Value(std::nan("")),
      Value(Date{-std::numeric_limits<double>::infinity()}),
      Value(Bytes("data")),
      Value("cut off \xE2\x82"),
      Value(std::string_view("12345678é").substr(0, 9)),  // the bytes after the end would complete it
      Value(Dictionary{{"key \xFF", 1}}),
      nested(65),
  };
  for (const auto& value : cases) {
    EXPECT_EQ(toJSON(value, JSONStyle::Compact), std::nullopt) << describe(value);
    EXPECT_EQ(toJSON(value, JSONStyle::Pretty), std::nullopt) << describe(value);
  }
  EXPECT_NE(compact(nested(64)), "(nothing)");
}

}  // namespace
}  // namespace vesk
