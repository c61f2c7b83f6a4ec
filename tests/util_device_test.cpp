// The device-information query and what is built on it.
#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <set>

#include "platform/device/DeviceInformation.h"
#include "tests/support/TestRoot.h"
#include "util/ReportingdUtil.h"

namespace vesk::test {
namespace {

constexpr char kFacts[] = "etc/veskreporting/device.toml";

class Device : public testing::Test {
 protected:
  void SetUp() override {
    std::filesystem::remove_all(testRoot() / "etc");
    for (const char* name : {"XDG_CONFIG_HOME", "HOME", "LC_ALL", "LC_MESSAGES", "LANG"}) ::unsetenv(name);
  }
};

TEST_F(Device, SaysWhatItsFactsFileSays) {
  testRoot().write(
      kFacts,
      "ProductVersion = \"7.1\"\nBuildVersion = 2210\nProductType = \"Sorrel3,1\"\nDeviceName = \"Küche\"\n"
      "HWModelStr = \"S31\"\nSerialNumber = \"X1\"\n");
  EXPECT_EQ(deviceProductVersion(), Text("7.1"));
  EXPECT_EQ(deviceBuildVersion(), Text("2210"));
  EXPECT_EQ(deviceProductType(), Text("Sorrel3,1"));
  EXPECT_EQ(deviceName(), Text("Küche"));
  EXPECT_EQ(deviceHardwareModel(), Text("S31"));
  EXPECT_EQ(deviceSerialNumber(), Text("X1"));
  EXPECT_EQ(QNCopyAnswer("ReleaseType"), std::nullopt);
}

TEST_F(Device, FallsBackOnTheOperatingSystem) {
  testRoot().write("etc/os-release", "ID=debian\nVERSION_ID=\"12\"\nVERSION=\"12 \\\"bookworm\\\"\"\n");
  EXPECT_EQ(QNCopyAnswer("ProductVersion"), "12");
  EXPECT_EQ(QNCopyAnswer("BuildVersion"), "12 \"bookworm\"");
  testRoot().write("etc/os-release", "BUILD_ID='22F82'\nVERSION=x");
  EXPECT_EQ(QNCopyAnswer("BuildVersion"), "22F82");
  EXPECT_EQ(QNCopyAnswer("ProductVersion"), std::nullopt);
}

TEST_F(Device, IgnoresFactsThatAreNone) {
  testRoot().write("etc/os-release", "VERSION_ID=12\n");
  for (const std::string& fact :
       {std::string(), std::string(129, 'x'), std::string("a\\nb"), std::string("a\\u0000")}) {
    testRoot().write(kFacts, "ProductVersion = \"" + fact + "\"\n");
    EXPECT_EQ(QNCopyAnswer("ProductVersion"), "12") << fact;
  }
  testRoot().write(kFacts, "ProductVersion = \"" + std::string(128, 'x') + "\"\n");
  EXPECT_EQ(QNCopyAnswer("ProductVersion"), std::string(128, 'x'));
}

TEST_F(Device, HasAnIdentifierThatIsDerivedFromItsMachineID) {
  std::set<std::string> identifiers;
  for (const char* machineID : {"0123456789abcdef0123456789abcdef\n", "0123456789abcdef0123456789abcdee\n"}) {
    testRoot().write("etc/machine-id", machineID);
    const std::string identifier = QNCopyAnswer("UniqueDeviceID").value_or("");
    EXPECT_EQ(identifier.size(), 40u);
    EXPECT_EQ(identifier.find_first_not_of("0123456789abcdef"), std::string::npos);
    EXPECT_EQ(QNCopyAnswer("UniqueDeviceID"), identifier);
    EXPECT_EQ(identifier.find("0123456789abcd"), std::string::npos);
    identifiers.insert(identifier);
  }
  EXPECT_EQ(identifiers.size(), 2u);
  for (const char* none : {"uninitialized\n", "", "0123456789abcdef\n"}) {
    testRoot().write("etc/machine-id", none);
    EXPECT_EQ(QNCopyAnswer("UniqueDeviceID"), std::nullopt) << none;
  }
}

TEST_F(Device, CopiesItsIdentifierIntoABuffer) {
  char buffer[41] = "untouched";
  copyUniqueDeviceID(buffer, sizeof buffer);
  EXPECT_STREQ(buffer, "untouched");
  const std::string identifier(40, 'a');
  testRoot().write(kFacts, "UniqueDeviceID = \"" + identifier + "\"\n");
  std::memset(buffer, 'x', sizeof buffer);
  copyUniqueDeviceID(buffer, sizeof buffer);
  EXPECT_EQ(buffer, identifier);
  char cramped[] = "12345678|behind";
  copyUniqueDeviceID(cramped, 8);
  EXPECT_STREQ(cramped, "");
  EXPECT_STREQ(cramped + 8, "|behind");
  copyUniqueDeviceID(nullptr, 0);
}

TEST_F(Device, KnowsItsRegion) {
  const struct {
    const char* locale;
    std::optional<std::string> region;
  } cases[] = {{"de_AT.UTF-8", "AT"},     {"pt_BR", "BR"},      {"sr_RS.UTF-8@latin", "RS"},
               {"en_us", "US"},           {"C", std::nullopt},  {"POSIX", std::nullopt},
               {"C.UTF-8", std::nullopt}, {"de", std::nullopt}, {"es_419", std::nullopt}};
  for (const auto& c : cases) {
    ::setenv("LANG", c.locale, 1);
    EXPECT_EQ(regionCode(), c.region) << c.locale;
  }
  ::setenv("LC_MESSAGES", "fr_FR", 1);
  EXPECT_EQ(regionCode(), "FR");
  ::setenv("LC_ALL", "", 1);
  EXPECT_EQ(regionCode(), "FR");
  ::setenv("LC_ALL", "it_IT", 1);
  EXPECT_EQ(regionCode(), "IT");
  testRoot().write(kFacts, "RegionCode = \"jp\"\n");
  EXPECT_EQ(regionCode(), "JP");
}

TEST_F(Device, KnowsItsOffsetFromGMT) {
  using std::chrono::seconds;
  const auto at = [](std::int64_t time) { return timezoneOffsetSeconds(WallTime(seconds(time))); };
  ::setenv("TZ", "CET-1CEST,M3.5.0,M10.5.0/3", 1);
  EXPECT_EQ(at(1764016289), 3600);  // November
  EXPECT_EQ(at(1753000000), 7200);  // July
  EXPECT_EQ(at(1761440399), 7200);  // the last second of summer time
  EXPECT_EQ(at(1761440400), 3600);
  EXPECT_EQ(at(-1), 3600);
  ::setenv("TZ", "NST3:30", 1);
  EXPECT_EQ(at(1764016400), -12600);
  ::unsetenv("TZ");
}

TEST_F(Device, HasNoConsentUnlessItWasGiven) {
  const auto consent = [](const char* preference) {
    testRoot().write("etc/veskreporting/preferences/com.corvane.veskreporting.toml", preference);
    return diagnosticsSubmissionConsent();
  };
  EXPECT_FALSE(diagnosticsSubmissionConsent());
  EXPECT_TRUE(consent("diagnosticsSubmission = true\n"));
  EXPECT_FALSE(consent("diagnosticsSubmission = false\n"));
  EXPECT_FALSE(consent("diagnosticsSubmission = \"true\"\n"));
  EXPECT_FALSE(consent("diagnosticsSubmission = 1\n"));
}

TEST_F(Device, RunsAnInternalBuildOnlyWhenItSaysSoAndForGood) {
  // What is found out first stays for the life of the process, so each answer takes a process of its own.
  const auto exitStatus = [](const char* facts) {
    testRoot().write(kFacts, facts);
    std::_Exit(isInternalBuild() ? 1 : 0);
  };
  for (const char* facts : {"", "ReleaseType = \"internal\"\n", "ReleaseType = \"Internal \"\n"}) {
    EXPECT_EXIT(exitStatus(facts), testing::ExitedWithCode(0), "") << facts;
  }
  testRoot().write(kFacts, "ReleaseType = \"Internal\"\n");
  EXPECT_TRUE(isInternalBuild());
  testRoot().write(kFacts, "ReleaseType = \"Beta\"\n");
  EXPECT_TRUE(isInternalBuild());
}

TEST(ReportingdUtil, BuildsTheCorrelationKey) {
  EXPECT_EQ(correlationKeyForUserInfo({{"clientName", "MyApp"}, {"serviceName", "Calls"}}), "myapp:calls");
  EXPECT_EQ(correlationKeyForUserInfo({{"serviceName", "ÄCalls"}}), ":äcalls");
  EXPECT_EQ(correlationKeyForUserInfo({{"clientName", 5}, {"other", "x"}}), ":");
  EXPECT_EQ(correlationKeyForUserInfo({}), ":");
}

}  // namespace
}  // namespace vesk::test
