#include "platform/json/JSONWriter.h"

#include <gtest/gtest.h>

#include <boost/json.hpp>
#include <cmath>
#include <cstdlib>
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
      {std::getenv("VESK_IS_NOT_SET"), "null"},
      {true, "true"},
      {-5, "-5"},
      {std::numeric_limits<std::int64_t>::min(), "-9223372036854775808"},
      {std::numeric_limits<std::uint64_t>::max(), "18446744073709551615"},
      {0.1, "0.1"},
      {-0.0, "-0.0"},
      {3.0, "3.0"},
      {1764016289.123456, "1764016289.123456"},
      {Date{1764016289.000001}, "1764016289.000001"},
      {"", "\"\""},
      {"plain text that is longer than eight", "\"plain text that is longer than eight\""},
      {"quote \" in the middle of it", R"("quote \" in the middle of it")"},
      {"back\\slash and tab\t", R"("back\\slash and tab\t")"},
      {std::string("\x00\x1f\x7f", 3), "\"\\u0000\\u001F\x7f\""},
      {"äöü → 🎉 and more ASCII after it", "\"äöü → 🎉 and more ASCII after it\""},
      {List{}, "[]"},
      {Dictionary{}, "{}"},
      {Dictionary{{"a", List{1, "b", Value()}}, {"c", Dictionary{{"d", 2u}}}},
       R"({"a":[1,"b",null],"c":{"d":2}})"},
  };
  for (const auto& c : cases) EXPECT_EQ(compact(c.value), c.text);
  static_assert(!std::is_constructible_v<Value, const Value*>, "a pointer is no boolean");
  EXPECT_EQ(Text(std::getenv("VESK_IS_NOT_SET")), "");
}

TEST(JSON, RefusesWhatItCannotCarry) {
  const Value cases[] = {
      Value(std::nan("")),
      Value(std::numeric_limits<double>::infinity()),
      Value(Date{-std::numeric_limits<double>::infinity()}),
      Value(Bytes("data")),
      Value("cut off \xE2\x82"),
      Value("cut off and more \xE2\x82 of it"),
      Value(std::string(64, 'k') + "\xF0"
                                   "a"),
      Value("\xE2("),
      Value("above the range \xF4\x90\x80\x80 here"),
      Value("stray \x80 byte"),
      Value(Dictionary{{"key \xFF", 1}}),
      Value(List{1, List{Value(std::nan(""))}, 2}),
      nested(65),
  };
  for (const auto& value : cases) {
    EXPECT_EQ(toJSON(value, JSONStyle::Compact), std::nullopt) << describe(value);
    EXPECT_EQ(toJSON(value, JSONStyle::Pretty), std::nullopt) << describe(value);
  }
  EXPECT_NE(compact(nested(64)), "(nothing)");
}

TEST(JSON, StopsAtTheEndOfATextThatIsNotTerminated) {
  // The bytes behind the cut would complete the character.
  const std::string whole = "12345678é";
  EXPECT_EQ(compact(Value(std::string_view(whole).substr(0, 9))), "(nothing)");
  EXPECT_EQ(compact(Value(std::string_view(whole).substr(0, 8))), "\"12345678\"");
}

TEST(JSON, StreamsADocumentPartByPart) {
  MutableDictionary event;
  event.set("n", 1);
  JSONWriter writer(JSONStyle::Compact, 1);
  writer.beginObject();
  writer.key("postTime");
  writer.number(1.5);
  writer.key("events");
  writer.beginArray();
  writer.value(event);
  writer.value(Dictionary{{"n", 2}});
  writer.value(Value());
  writer.endArray();
  writer.key("more");
  writer.value(List{true});
  writer.endObject();
  EXPECT_EQ(writer.finish(), R"({"postTime":1.5,"events":[{"n":1},{"n":2},null],"more":[true]})");
}

TEST(JSON, FailsOnCallsOutOfOrder) {
  const auto fails = [](auto... calls) {
    JSONWriter writer(JSONStyle::Compact);
    (calls(writer), ...);
    return !writer.finish();
  };
  const auto object = [](JSONWriter& w) { w.beginObject(); };
  const auto endObject = [](JSONWriter& w) { w.endObject(); };
  const auto array = [](JSONWriter& w) { w.beginArray(); };
  const auto endArray = [](JSONWriter& w) { w.endArray(); };
  const auto key = [](JSONWriter& w) { w.key("k"); };
  const auto value = [](JSONWriter& w) { w.number(1); };
  EXPECT_TRUE(fails());
  EXPECT_TRUE(fails(object));
  EXPECT_TRUE(fails(value, value));
  EXPECT_TRUE(fails(key));
  EXPECT_TRUE(fails(object, value, endObject));
  EXPECT_TRUE(fails(object, key, endObject));
  EXPECT_TRUE(fails(object, key, key, value, endObject));
  EXPECT_TRUE(fails(array, key, value, endArray));
  EXPECT_TRUE(fails(array, endObject));
  EXPECT_TRUE(fails(endArray));
  EXPECT_FALSE(fails(object, key, value, key, array, endArray, endObject));
}

TEST(JSON, PrettyAndCompactTextSayTheSame) {
  MutableDictionary many;
  for (int i = 0; i < 200; ++i) {
    many.set("key " + std::to_string(i),
             List{i * 0.37, i, "text \"" + std::string(static_cast<std::size_t>(i), 'x')});
  }
  const Value value = many.share();
  const auto pretty = toJSON(value, JSONStyle::Pretty);
  ASSERT_TRUE(pretty);
  EXPECT_NE(pretty->find("\n    \"key 1\": [\n        0.37,"), std::string::npos);
  EXPECT_EQ(boost::json::parse(*pretty), boost::json::parse(compact(value)));
}

}  // namespace
}  // namespace vesk
