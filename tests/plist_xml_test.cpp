#include <gtest/gtest.h>

#include <cmath>

#include "platform/plist/PropertyList.h"

namespace vesk {
namespace {

std::string document(std::string_view content) {
  return "<plist version=\"1.0\">" + std::string(content) + "</plist>";
}

std::string repeated(std::string_view text, std::size_t count) {
  std::string out;
  for (std::size_t i = 0; i < count; ++i) out += text;
  return out;
}

std::string nestedArrays(std::size_t depth) {
  return document(repeated("<array>", depth) + repeated("</array>", depth));
}

// What plistlib writes is read in plist_oracle_test.cpp.
TEST(XMLPropertyList, ReadsTheRarerForms) {
  const struct {
    const char* content;
    Value value;
  } cases[] = {
      {"<string>a &amp; b &#x2192; c</string>", "a & b → c"},
      {"<string><![CDATA[<raw>]]></string>", "<raw>"},
      {"<string/>", ""},
      {"<integer> +7 </integer>", 7},
      {"<integer>0xFF</integer>", 255},
      {"<integer>-0x10</integer>", -16},
      {"<real>+1.5e3</real>", 1500.0},
      {"<real>-infinity</real>", -HUGE_VAL},
      {"<date>2000-02-29T23:59:59Z</date>", Date{951868799}},
      {"<dict><key>k</key><integer>1</integer><key>k</key><integer>2</integer></dict>", Dictionary{{"k", 2}}},
      {" <!-- a note --> <array> <true/> </array> ", List{true}},
  };
  for (const auto& c : cases) {
    const auto outcome = parsePropertyList(document(c.content));
    EXPECT_EQ(outcome.value, c.value) << c.content << ": " << outcome.error;
  }
  const auto nan = parsePropertyList(document("<real>nan</real>"));
  ASSERT_TRUE(nan.value && nan.value->real());
  EXPECT_TRUE(std::isnan(*nan.value->real()));
}

TEST(XMLPropertyList, RefusesWhatIsWrong) {
  const std::string cases[] = {
      "", "\xEF\xBB\xBF", "not XML", "<plist/>", "<string>no plist around</string>",
      document("<string>a</string><string>b</string>"), document("<string>a</string>") + "trailing",
      document("<unknown/>"), document("<plist><true/></plist>"), document("<true>x</true>"),
      document("text"), document("<array>text</array>"), document("<string><true/></string>"),
      document("<key>k</key>"), document("<dict><true/></dict>"), document("<dict><key>k</key></dict>"),
      document("<dict><key>k</key><key>l</key><true/></dict>"),
      document("<dict><integer>1</integer><true/></dict>"), document("<array><key>k</key></array>"),
      document("<integer/>"), document("<integer>1.5</integer>"), document("<integer>--1</integer>"),
      document("<integer>18446744073709551616</integer>"),
      document("<integer>-9223372036854775809</integer>"), document("<integer>0x</integer>"),
      document("<real>1,5</real>"), document("<real>0x1p3</real>"),
      document("<date>2023-02-29T00:00:00Z</date>"), document("<date>2023-01-01T24:00:00Z</date>"),
      document("<date>2023-01-01</date>"), document("<data>a===</data>"), document("<string>\xFF</string>"),
      document("<string>\xED\xA0\x80</string>"), document("<string>&#0;</string>"),
      document(std::string("<string>\0</string>", 18)), document("<string>&undefined;</string>"),
      // What is declared elsewhere is never fetched, so nobody knows what this stands for.
      "<!DOCTYPE plist SYSTEM \"file:///etc/passwd\">" + document("<string>&undefined;</string>"),
      "<!DOCTYPE plist [<!ENTITY a \"b\">]>" + document("<string>&a;</string>"),
      "<!DOCTYPE plist [<!ENTITY a SYSTEM \"file:///etc/passwd\">]>" + document("<string>&a;</string>"),
      "<?xml version=\"1.0\" encoding=\"x-unknown\"?>" + document("<true/>")};
  for (const auto& text : cases) {
    const auto outcome = parsePropertyList(text);
    EXPECT_FALSE(outcome.value) << text;
    EXPECT_FALSE(outcome.error.empty()) << text;
  }
}

TEST(XMLPropertyList, ReadsUTF16WithAByteOrderMark) {
  std::string wide("\xFE\xFF");
  for (char c : document("<string>wide</string>")) wide += {'\0', c};
  EXPECT_EQ(parsePropertyList(wide).value, Value("wide"));
}

TEST(XMLPropertyList, KeepsItsLimits) {
  EXPECT_TRUE(parsePropertyList(nestedArrays(64)).value);
  EXPECT_FALSE(parsePropertyList(nestedArrays(65)).value);
  EXPECT_FALSE(parsePropertyList(nestedArrays(50'000)).value);
  EXPECT_TRUE(parsePropertyList(document("<array>" + repeated("<true/>", 99'999) + "</array>")).value);
  EXPECT_FALSE(parsePropertyList(document("<array>" + repeated("<true/>", 100'000) + "</array>")).value);
  EXPECT_FALSE(parsePropertyList(document("<string>" + std::string(1 << 20, 'x') + "</string>")).value);
}

TEST(XMLPropertyList, SaysWhereTheFaultIs) {
  EXPECT_EQ(parsePropertyList("<plist>\n<array>\n <true>x</true></array></plist>").error,
            "line 3, column 15: not a valid value: x");
}

TEST(XMLPropertyList, IsWrittenForPeople) {
  EXPECT_EQ(
      writeXMLPropertyList(Dictionary{{"a<b", List{1, Dictionary{}}}}),
      "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<dict>\n\t<key>a&lt;b</key>\n"
      "\t<array>\n\t\t<integer>1</integer>\n\t\t<dict/>\n\t</array>\n</dict>\n</plist>\n");
}

TEST(XMLPropertyList, KeepsLineEndsAsTheyAre) {
  const Value text("\r\n and \r and \n and \t");
  EXPECT_EQ(parsePropertyList(*writeXMLPropertyList(text)).value, text);
}

TEST(XMLPropertyList, IsNotWrittenWithWhatNobodyCouldReadBack) {
  Value deep = List{};
  for (int i = 1; i < 65; ++i) deep = List{deep};
  for (const Value& value :
       {Value(), Value("\x01"), Value(std::string_view("\0", 1)), Value("\xFF"), Value("\uFFFE"),
        Value(Date{std::nan("")}), Value(Date{1e300}), Value(Dictionary{{"\x02", 1}}), deep}) {
    EXPECT_EQ(writeXMLPropertyList(value), std::nullopt) << describe(value);
  }
}

}  // namespace
}  // namespace vesk
