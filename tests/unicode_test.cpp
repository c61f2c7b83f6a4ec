#include "platform/unicode/Unicode.h"

#include <gtest/gtest.h>

#include "platform/unicode/UTF8.h"

namespace vesk {
namespace {

TEST(Unicode, LowercasesByTheFullMapping) {
  const std::pair<const char*, const char*> cases[] = {
      {"MyApp 42 I", "myapp 42 i"},
      {"ΟΔΟΣ", "οδος"},       // a final sigma has its own form
      {"İ", "i\xCC\x87"},     // becomes two characters
      {"AÄ\xFFZ", "aä\xFFz"}  // not UTF-8
  };
  for (auto [text, lower] : cases) EXPECT_EQ(lowercase(text), lower);
}

TEST(Unicode, ComparesWithoutCase) {
  const struct {
    const char* a;
    const char* b;
    bool isEqual;
  } cases[] = {
      {"USERNAME", "username", true}, {"username", "usernames", false}, {"@", "`", false},
      {"straße", "STRASSE", true},    {"Kelvin", "\u212Aelvin", true},  {"user é", "USER É ", false},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(equalsIgnoringCase(c.a, c.b), c.isEqual) << c.a << " " << c.b;
    EXPECT_EQ(equalsIgnoringCase(c.b, c.a), c.isEqual) << c.b << " " << c.a;
  }
}

TEST(Unicode, FindsFragmentsWithoutCase) {
  EXPECT_TRUE(containsIgnoringCase("MyCallService", "call"));
  EXPECT_TRUE(containsIgnoringCase("Große Straße", "STRASSE"));
  EXPECT_FALSE(containsIgnoringCase("call", "calls"));
  EXPECT_FALSE(containsIgnoringCase("anything", ""));
}

TEST(Unicode, TellsWellFormedUTF8) {
  for (const char* text :
       {"", "ASCII only, longer than eight", "\x7F\xC2\x80\xDF\xBF\xE0\xA0\x80", "\uFDD0\uFFFE\uFFFF",
        "\U00010000", "\U0010FFFF", "eight bytes and then \U0001F389"}) {
    EXPECT_TRUE(isValidUTF8(text)) << text;
  }
  for (const char* text : {"\x80", "\xC0\x80", "\xC1\xBF", "\xC3", "\xE0\x80\x80", "\xE0\x9F\xBF", "\xE2\x82",
                           "\xED\xA0\x80", "\xF0\x80\x80\x80", "\xF0\x8F\xBF\xBF", "\xF4\x90\x80\x80",
                           "\xF5\x80\x80\x80", "\xFF", "long enough for eight\xC3", "\xE2\x82 \x82"}) {
    EXPECT_FALSE(isValidUTF8(text)) << text;
  }
  const std::string_view withNUL("a\0b", 3);
  EXPECT_TRUE(isValidUTF8(withNUL));
  EXPECT_FALSE(isValidUTF8(withNUL, false));
}

}  // namespace
}  // namespace vesk
