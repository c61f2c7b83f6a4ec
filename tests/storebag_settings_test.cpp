// Names, settings and typed reading of storebags.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <limits>

#include "storebag/Settings.h"
#include "storebag/StorebagFallback.h"
#include "storebag/StorebagNaming.h"
#include "storebag/StorebagProfile.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/TestRoot.h"
#include "util/ReportingdUtil.h"

namespace vesk::test {
namespace {

using Lines = std::vector<std::pair<int, std::string>>;

void writePreferences(std::string_view toml) {
  testRoot().write("etc/veskreporting/preferences/com.corvane.veskreporting.toml", toml);
}

/// Returns the result of `body` in a new process, with the lines that it logged: "<level> text". Some
/// settings are fixed for the life of a process.
std::string inNewProcess(const std::function<std::string()>& body) {
  pid_t child = ::fork();
  if (child == 0) {
    CapturedLog log;
    const std::string result = body();
    std::string text;
    for (const auto& [level, line] : log.lines()) text += "<" + std::to_string(level) + "> " + line + "\n";
    testRoot().write("result", text + result);
    ::_exit(0);
  }
  int status = -1;
  ::waitpid(child, &status, 0);
  return status == 0 ? testRoot().read("result") : "ended with status " + std::to_string(status);
}

TEST(StorebagNaming, NamesTheStorebagOfAClientType) {
  const char* names[] = {"zelko", "brannic", "palvo", "tessin", "quimby", "dorvel", "palvo"};
  for (std::int32_t type = 5; const char* name : names) EXPECT_EQ(storebagNameForClientType(type++), name);
  for (std::int32_t type : {-1, 0, 1, 2, 3, 4, 12, 1000, INT32_MIN, INT32_MAX})
    EXPECT_EQ(storebagNameForClientType(type), std::nullopt) << type;
}

TEST(Settings, ThereIsNoConsentUnlessItWasGiven) {
  for (const auto& [preference, consents] :
       {std::pair{"", false}, {"= true", true}, {"= false", false}, {"= \"true\"", false}, {"= 1", false}}) {
    writePreferences(*preference ? std::string("diagnosticsSubmission ") + preference : "");
    EXPECT_EQ(diagnosticsSubmissionConsent(), consents) << preference;
  }
}

TEST(StorebagNaming, TheEnvironmentIsReadOnceAndSaysWhatItIs) {
  const std::tuple<const char*, int, const char*> cases[] = {
      {"", 3, nullptr},          {"0", 0, nullptr},         {"1", 1, nullptr},   {"2", 2, nullptr},
      {"3", 3, nullptr},         {"4", 4, nullptr},         {"5", 2, "5"},       {"7", 2, "7"},
      {"-1", 2, "4294967295"},   {"8589934592", 2, "0"},    {"4.9", 4, nullptr}, {"'4 or so'", 4, nullptr},
      {"'-3'", 2, "4294967293"}, {"'release'", 0, nullptr}, {"[4]", 0, nullptr}, {"{ a = 4 }", 0, nullptr},
      {"2026-11-24", 0, nullptr}};
  for (const auto& [setting, expectedType, invalid] : cases) {
    writePreferences(*setting ? std::string("environmentType = ") + setting : "");
    std::string expected;
    if (invalid)
      expected = std::string("<3> userDefaultsEnvironment: Invalid environment type ") + invalid + "\n";
    const std::string type = std::to_string(expectedType);
    expected += "<6> userDefaultsEnvironment: Environment type " + type + "\n" + type + " " + type;
    EXPECT_EQ(inNewProcess([] {
                const auto first = currentEnvironmentType();
                writePreferences(first == 1 ? "environmentType = 4" : "environmentType = 1");
                return std::to_string(first) + " " + std::to_string(currentEnvironmentType());
              }),
              expected)
        << setting;
  }
}

TEST(StorebagNaming, TheServerIsReadOnceTheOverrideOrThatOfTheBuild) {
  const std::tuple<const char*, const char*, const char*> cases[] = {
      {"", "", "https://" VESK_STOREBAG_HOST "/bags/sorrel"},
      {"", "ReleaseType = 'Beta'", "https://" VESK_STOREBAG_HOST "/bags/sorrel"},
      {"", "ReleaseType = 'Internal'", "https://" VESK_PARTNER_STOREBAG_HOST "/storebags/sorrel"},
      {"veskreporting_storebag_url = 'http://here:1/x '", "", "http://here:1/x "},
      {"veskreporting_storebag_url = 'no URL'", "ReleaseType = 'Internal'", "no URL"},
      {"veskreporting_storebag_url = ''", "", ""},
      {"veskreporting_storebag_url = 12", "", "12"}};
  for (const auto& [setting, facts, url] : cases) {
    writePreferences(setting);
    testRoot().write("etc/veskreporting/device.toml", facts);
    EXPECT_EQ(inNewProcess([] {
                const std::string first = storebagServerBaseURL();
                writePreferences("veskreporting_storebag_url = 'http://later'");
                testRoot().write("etc/veskreporting/device.toml", "");
                return first + "|" + storebagServerBaseURL();
              }),
              std::string(url) + "|" + url);
  }
}

TEST(StorebagNaming, OtherSettingsAreReadAfreshAsText) {
  writePreferences("httpsPostURL = 'https://a/'\nnumber = 12\n");
  EXPECT_EQ(preferenceStringForKey("httpsPostURL"), "https://a/");
  EXPECT_EQ(preferenceStringForKey("number"), "12");
  EXPECT_EQ(preferenceStringForKey("absent"), std::nullopt);
  writePreferences("httpsPostURL = 'https://b/'\n");
  EXPECT_EQ(preferenceStringForKey("httpsPostURL"), "https://b/");
}

TEST(StorebagFallback, HoldsOneBackendForEveryEnvironmentButSeed) {
  const Dictionary section{{"wren", Dictionary{{"active", true}}}};
  EXPECT_EQ(fallbackStorebag(), (Dictionary{{"corvane_internal", section},
                                            {"development", section},
                                            {"release", section},
                                            {"version", "1.0.0-Palvo-Fallback"},
                                            {"refresh_cycle", 3600}}));
}

TEST(StorebagProfile, ReadsValuesOfTheirType) {
  const Dictionary inner{{"a", 1}};
  const Dictionary profile{{"text", "12 or so"},
                           {"real", 2.75},
                           {"list", List{"a", "b"}},
                           {"inner", inner},
                           {"infinite", std::numeric_limits<double>::infinity()}};
  CapturedLog log;
  EXPECT_EQ(profileText("b", profile, "text"), "12 or so");
  EXPECT_EQ(profileInteger("b", profile, "real"), 2);
  EXPECT_EQ(profileInteger("b", profile, "infinite"), std::numeric_limits<std::int64_t>::max());
  EXPECT_EQ(profileIntegerOrNumericText("b", profile, "text"), 12);
  EXPECT_EQ(profileIntegerOrNumericText("b", profile, "real"), 2);
  EXPECT_EQ(profileList("b", profile, "list"), (List{"a", "b"}));
  EXPECT_EQ(profileDictionary("b", profile, "inner"), inner);
  EXPECT_FALSE(profileText("b", profile, "absent"));
  EXPECT_EQ(log.lines(), Lines());
}

TEST(StorebagProfile, AWrongTypeCountsAsAbsentAndCostsOneLine) {
  const Value values[] = {Value(),    "text",  1,      1.5,          true,
                          Bytes("x"), Date{1}, List{}, Dictionary{}, std::string(70, 'x')};
  for (const Value& value : values) {
    const Dictionary profile{{"the key", value}};
    const bool isText = value.text() != nullptr;
    CapturedLog log;
    const std::pair<bool, bool> readings[] = {
        {profileText("the backend", profile, "the key").has_value(), isText},
        {profileInteger("the backend", profile, "the key").has_value(), value.isNumber()},
        {profileIntegerOrNumericText("the backend", profile, "the key").has_value(),
         value.isNumber() || isText},
        {profileList("the backend", profile, "the key").has_value(), value.list() != nullptr},
        {profileDictionary("the backend", profile, "the key").has_value(), value.dictionary() != nullptr}};
    std::size_t absent = 0;
    for (const auto& [isThere, isOfThatType] : readings) {
      EXPECT_EQ(isThere, isOfThatType);
      absent += isOfThatType ? 0 : 1;
    }
    const std::pair<int, std::string> line{
        4, "the backend: The storebag's value for 'the key' has the wrong type and counts as absent: " +
               describe(value, 64)};
    EXPECT_EQ(log.lines(), Lines(absent, line));
  }
}

}  // namespace
}  // namespace vesk::test
