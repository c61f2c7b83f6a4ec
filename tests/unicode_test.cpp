#include "platform/unicode/Unicode.h"

#include <gtest/gtest.h>

#include "platform/unicode/UTF8.h"

namespace vesk {
namespace {

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
