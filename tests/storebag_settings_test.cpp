// Names, settings and typed reading of storebags.
#include <gtest/gtest.h>

#include <limits>

#include "storebag/StorebagFallback.h"
#include "storebag/StorebagNaming.h"
#include "storebag/StorebagProfile.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/TestRoot.h"

namespace vesk::test {
namespace {

void writePreferences(std::string_view toml) {
  testRoot().write("etc/veskreporting/preferences/com.corvane.veskreporting.toml", toml);
}

TEST(StorebagNaming, NamesTheStorebagOfAClientType) {
  const std::optional<std::string_view> names[] = {
      std::nullopt, std::nullopt, std::nullopt, std::nullopt, std::nullopt, "zelko",     "brannic",
      "palvo",      "tessin",     "quimby",     "dorvel",     "palvo",      std::nullopt};
  for (int type = 0; type < 13; ++type) EXPECT_EQ(storebagNameForClientType(type), names[type]) << type;
  for (int type : {-1, 1000, std::numeric_limits<int>::min(), std::numeric_limits<int>::max()}) {
    EXPECT_FALSE(storebagNameForClientType(type)) << type;
  }
}

TEST(StorebagNaming, ReadsTheEnvironmentTypeFromASetting) {
  const struct {
    std::optional<Value> setting;
    int type;
    const char* invalid = nullptr;
  } cases[] = {
      {std::nullopt, 3},
      {Value(0), 0},
      {Value(4), 4},
      {Value(5), 2, "5"},
      {Value(-1), 2, "4294967295"},
      {Value("4 or so"), 4},
      {Value("-3"), 2, "4294967293"},
      {Value(std::int64_t{1} << 33), 2, "0"},
  };
  for (const auto& test : cases) {
    CapturedLog log;
    EXPECT_EQ(environmentTypeForPreference(test.setting), test.type);
    EXPECT_EQ(log.lines().size(), test.invalid ? 1u : 0u);
    const std::string line = "userDefaultsEnvironment: Invalid environment type ";
    EXPECT_EQ(log.count(3, line + (test.invalid ? test.invalid : "")), test.invalid ? 1 : 0);
  }
}

TEST(StorebagNaming, TheEnvironmentTypeIsReadOnceForTheProcess) {
  CapturedLog log;
  writePreferences("environmentType = 7\n");
  EXPECT_EQ(currentEnvironmentType(), 2);
  EXPECT_EQ(log.count(3, "userDefaultsEnvironment: Invalid environment type 7"), 1);
  EXPECT_EQ(log.count(6, "userDefaultsEnvironment: Environment type 2"), 1);
  writePreferences("environmentType = 1\n");
  EXPECT_EQ(currentEnvironmentType(), 2);
  EXPECT_EQ(log.countContaining(6, "userDefaultsEnvironment"), 1);
}

TEST(StorebagNaming, OtherSettingsAreReadAfreshAsText) {
  writePreferences("httpsPostURL = 'https://a/'\nnumber = 12\n");
  EXPECT_EQ(preferenceStringForKey("httpsPostURL"), "https://a/");
  EXPECT_EQ(preferenceStringForKey("number"), "12");
  EXPECT_FALSE(preferenceStringForKey("absent"));
  writePreferences("httpsPostURL = 'https://b/'\n");
  EXPECT_EQ(preferenceStringForKey("httpsPostURL"), "https://b/");
}

TEST(StorebagNaming, TheServerIsTheOverrideOrThatOfTheBuild) {
  EXPECT_EQ(storebagServerBaseURLFor("http://here:1/x", true), "http://here:1/x");
  EXPECT_EQ(storebagServerBaseURLFor("", false), "");
  std::string partners = storebagServerBaseURLFor(std::nullopt, true);
  std::string general = storebagServerBaseURLFor(std::nullopt, false);
  EXPECT_TRUE(partners.starts_with("https://") && partners.ends_with("/storebags/sorrel")) << partners;
  EXPECT_TRUE(general.starts_with("https://") && general.ends_with("/bags/sorrel")) << general;

  writePreferences("veskreporting_storebag_url = 'http://first'\n");
  EXPECT_EQ(storebagServerBaseURL(), "http://first");
  writePreferences("veskreporting_storebag_url = 'http://second'\n");
  EXPECT_EQ(storebagServerBaseURL(), "http://first");
}

TEST(StorebagFallback, HoldsOneBackendForEveryEnvironmentButSeed) {
  const Dictionary section{{"wren", Dictionary{{"active", true}}}};
  EXPECT_EQ(fallbackStorebag(), (Dictionary{{"corvane_internal", section},
                                            {"development", section},
                                            {"release", section},
                                            {"version", "1.0.0-Palvo-Fallback"},
                                            {"refresh_cycle", 3600}}));
}

TEST(StorebagProfile, ReadsValuesOfTheirTypeAndReportsTheRest) {
  const Dictionary inner{{"a", 1}};
  const Dictionary profile{{"text", "t"},
                           {"whole", 3},
                           {"real", 2.75},
                           {"flag", true},
                           {"list", List{"a", "b"}},
                           {"inner", inner},
                           {"mixed", List{"a", 1, "b", inner}},
                           {"bytes", Bytes("x")},
                           {"infinite", std::numeric_limits<double>::infinity()}};
  CapturedLog log;
  EXPECT_EQ(profileText("b", profile, "text"), "t");
  EXPECT_EQ(profileNumber("b", profile, "real"), Value(2.75));
  EXPECT_EQ(profileNumber("b", profile, "flag"), Value(true));
  EXPECT_EQ(profileInteger("b", profile, "real"), 2);
  EXPECT_EQ(profileInteger("b", profile, "infinite"), std::numeric_limits<std::int64_t>::max());
  EXPECT_EQ(profileList("b", profile, "list"), (List{"a", "b"}));
  EXPECT_EQ(profileTextList("b", profile, "list"), (std::vector<std::string>{"a", "b"}));
  EXPECT_EQ(profileDictionary("b", profile, "inner"), inner);
  EXPECT_FALSE(profileText("b", profile, "absent"));
  EXPECT_FALSE(profileTextList("b", profile, "absent"));
  EXPECT_TRUE(log.lines().empty());

  EXPECT_EQ(profileTextList("backend", profile, "mixed"), (std::vector<std::string>{"a", "b"}));
  EXPECT_EQ(log.countContaining(4, "backend: "), 1);
  EXPECT_EQ(log.countContaining(4, "'mixed'"), 1);
}

TEST(StorebagProfile, AWrongTypeCountsAsAbsentAndCostsOneLine) {
  const Value values[] = {Value(), "text", 1, 1.5, true, Bytes("x"), Date{1}, List{}, Dictionary{}};
  for (const Value& value : values) {
    const Dictionary profile{{"the key", value}};
    CapturedLog log;
    const std::pair<bool, bool> readings[] = {
        {profileText("the backend", profile, "the key").has_value(), value.text() != nullptr},
        {profileNumber("the backend", profile, "the key").has_value(), value.isNumber()},
        {profileInteger("the backend", profile, "the key").has_value(), value.isNumber()},
        {profileList("the backend", profile, "the key").has_value(), value.list() != nullptr},
        {profileTextList("the backend", profile, "the key").has_value(), value.list() != nullptr},
        {profileDictionary("the backend", profile, "the key").has_value(), value.dictionary() != nullptr}};
    int absent = 0;
    for (const auto& [isThere, isOfThatType] : readings) {
      EXPECT_EQ(isThere, isOfThatType);
      absent += isOfThatType ? 0 : 1;
    }
    EXPECT_EQ(log.countContaining(4, "the backend: The storebag's value for 'the key'"), absent);
  }
}

}  // namespace
}  // namespace vesk::test
