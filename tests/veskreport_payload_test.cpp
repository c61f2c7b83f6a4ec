#include <gtest/gtest.h>

#include "tools/veskreport/PayloadParser.h"

namespace vesk::test {
namespace {

TEST(PayloadParser, PairsBecomeValuesOfTheTypeThatIsWrittenOrSayWhatIsWrong) {
  const std::pair<std::vector<std::string>, const char*> cases[] = {
      {{"k=text"}, R"({"k": "text"})"},
      {{"k="}, R"({"k": ""})"},
      {{"k=1"}, R"({"k": "1"})"},
      {{"k=a=b:=c"}, R"({"k": "a=b:=c"})"},
      {{"a key=\xc3\xbc"}, "{\"a key\": \"\xc3\xbc\"}"},
      {{"k:=18446744073709551615"}, R"({"k": 18446744073709551615})"},
      {{"k:=1e3"}, R"({"k": 1000})"},
      {{R"(k:={"b":[1,"a",true,null],"a":-2})"}, R"({"k": {"b": [1, "a", true, null], "a": -2}})"},
      {{"key"}, "\"key\": neither key=text nor key:=json"},
      {{"=text"}, "\"=text\": the key is missing"},
      {{"k=1", "k:=2"}, "\"k:=2\": the key is given twice"},
      {{"k=\xff"}, "\"k=\xff\": not UTF-8"},
      {{R"(k:="\u0000")"}, R"("k:="\u0000"": a text holds a NUL)"}};
  for (const auto& [arguments, outcome] : cases) {
    const auto parsed = parsePairs(arguments);
    EXPECT_EQ(parsed ? describe(*parsed) : parsed.error().text, outcome);
  }
}

}  // namespace
}  // namespace vesk::test
