#include <gtest/gtest.h>

#include <limits>

#include "tools/veskreport/PayloadParser.h"

namespace vesk::test {
namespace {

TEST(PayloadParser, PairsBecomeValuesOfTheTypeThatIsWritten) {
  struct Case {
    const char* argument;
    const char* key;
    Value value;
  };
  for (const Case& c : {Case{"k=text", "k", "text"}, Case{"k=", "k", ""}, Case{"k=1", "k", "1"},
                        Case{"k=a=b:=c", "k", "a=b:=c"}, Case{"a key=\xc3\xbc", "a key", "\xc3\xbc"},
                        Case{"k:=18446744073709551615", "k", std::numeric_limits<std::uint64_t>::max()},
                        Case{"k:=1e3", "k", 1000.0},
                        Case{R"(k:={"b":[1,"a",true,null],"a":-2})", "k",
                             Dictionary{{"b", List{1, "a", true, Value()}}, {"a", -2}}}}) {
    SCOPED_TRACE(c.argument);
    auto parsed = parsePairs({c.argument});
    ASSERT_TRUE(parsed) << parsed.error().text;
    EXPECT_EQ(*parsed, (Dictionary{{c.key, c.value}}));
  }
}

TEST(PayloadParser, SaysWhatIsWrong) {
  struct Case {
    std::vector<std::string> arguments;
    const char* error;
  };
  for (const Case& c : {
           Case{{"key"}, "\"key\": neither key=text nor key:=json"},
           Case{{"=text"}, "\"=text\": the key is missing"},
           Case{{"k=1", "k:=2"}, "\"k:=2\": the key is given twice"},
           Case{{"k=\xff"}, "\"k=\xff\": not UTF-8"},
           Case{{R"(k:="\u0000")"}, R"("k:="\u0000"": a text holds a NUL)"},
       }) {
    auto parsed = parsePairs(c.arguments);
    ASSERT_FALSE(parsed);
    EXPECT_EQ(parsed.error().text, c.error);
  }
}

}  // namespace
}  // namespace vesk::test
