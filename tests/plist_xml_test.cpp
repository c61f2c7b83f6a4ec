#include <gtest/gtest.h>

#include <cmath>

#include "platform/plist/PropertyList.h"
#include "tools/plist/XMLPropertyListWriter.h"

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

TEST(XMLPropertyList, ReadsTheRarerForms) {
  const struct {
    const char* content;
    Value value;
  } cases[] = {
      {"<string>a &amp; b &#x2192; c</string>", "a & b → c"},
      {"<string><![CDATA[<raw>]]></string>", "<raw>"},
      {"<integer>0xFF</integer>", 255},
      {"<real>+1.5e3</real>", 1500.0},
      {"<real>-infinity</real>", -HUGE_VAL},
      {"<date>2000-02-29T23:59:59Z</date>", Date{951868799}},
      {"<dict><key>k</key><integer>1</integer><key>k</key><integer>2</integer></dict>", Dictionary{{"k", 2}}},
      {" <!-- a note --> <array> <true/> </array> ", List{true}},
  };
  for (const auto& c : cases) {
    const auto outcome = parsePropertyList(document(c.content));
    EXPECT_TRUE(outcome && *outcome == c.value) << c.content;
  }
}

TEST(XMLPropertyList, RefusesWhatIsWrong) {
  std::vector<std::string> cases = {
      "", "not XML", "<plist/>", "<string>no plist around</string>",
      // External declarations are never fetched, so the entity's value is unknown.
      "<!DOCTYPE plist SYSTEM \"file:///etc/passwd\">" + document("<string>&undefined;</string>"),
      "<!DOCTYPE plist [<!ENTITY a SYSTEM \"file:///etc/passwd\">]>" + document("<string>&a;</string>")};
  for (const char* content :
       {"<string>a</string><string>b</string>", "<unknown/>", "<plist><true/></plist>", "<true>x</true>",
        "<array>text</array>", "<string><true/></string>", "<key>k</key>", "<dict><true/></dict>",
        "<dict><key>k</key></dict>", "<dict><key>k</key><key>l</key><true/></dict>",
        "<array><key>k</key></array>", "<integer/>", "<integer>1.5</integer>",
        "<integer>18446744073709551616</integer>", "<integer>-9223372036854775809</integer>",
        "<real>1,5</real>", "<date>2023-02-29T00:00:00Z</date>", "<date>2023-01-01T24:00:00Z</date>",
        "<data>a===</data>"})
    cases.push_back(document(content));
  for (const auto& text : cases) {
    const auto outcome = parsePropertyList(text);
    ASSERT_FALSE(outcome) << text;
    EXPECT_FALSE(outcome.error().text.empty()) << text;
  }
}

TEST(XMLPropertyList, KeepsItsLimits) {
  EXPECT_TRUE(parsePropertyList(nestedArrays(64)));
  EXPECT_FALSE(parsePropertyList(nestedArrays(65)));
  EXPECT_EQ(parsePropertyList("<plist>\n<array>\n <true>x</true></array></plist>").error().text,
            "line 3, column 15: not a valid value: x");
  EXPECT_TRUE(parsePropertyList(document("<array>" + repeated("<true/>", 99'999) + "</array>")));
  EXPECT_FALSE(parsePropertyList(document("<array>" + repeated("<true/>", 100'000) + "</array>")));
  EXPECT_FALSE(parsePropertyList(document("<string>" + std::string(1 << 20, 'x') + "</string>")));
}

TEST(XMLPropertyList, KeepsLineEndsAsTheyAre) {
  const Value text("\r\n and \r and \n and \t");
  EXPECT_EQ(*parsePropertyList(*writeXMLPropertyList(text)), text);
}

}  // namespace
}  // namespace vesk
