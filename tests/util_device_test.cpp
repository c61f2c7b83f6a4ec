// The device-information query and the functions built on it.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdlib>
#include <map>

#include "platform/device/DeviceInformation.h"
#include "platform/device/FirmwareFacts.h"
#include "tests/support/TestRoot.h"
#include "util/ReportingdUtil.h"
#include "util/SamplingDraw.h"
#include "util/URLQuery.h"
#include "values/Conversions.h"

namespace vesk::test {
namespace {

constexpr char kFacts[] = "etc/veskreporting/device.toml";

class Device : public testing::Test {
 protected:
  void SetUp() override {
    for (const char* directory : {"etc", "usr"}) std::filesystem::remove_all(testRoot() / directory);
    for (const char* name : {"XDG_CONFIG_HOME", "HOME", "LC_ALL", "LC_MESSAGES", "LANG"}) ::unsetenv(name);
  }
};

TEST_F(Device, EachFactHasAKeyAndSourcesInOrder) {
  struct Fact {
    const char* key;
    std::optional<Text> (*getter)();
    const char* system;                 // from os-release, if the firmware has no value
    std::vector<std::string> firmware;  // in order of preference
  };
  const std::string dmi = "sys/class/dmi/id/";
  const std::string tree = "proc/device-tree/";
  const Fact facts[] = {
      {"ProductVersion", deviceProductVersion, "12", {}},
      {"BuildVersion", deviceBuildVersion, "22F82", {}},
      {"ProductType", deviceProductType, nullptr, {dmi + "product_name", tree + "model"}},
      {"DeviceName", deviceName, "Debian", {dmi + "product_family", dmi + "product_name", tree + "model"}},
      {"HWModelStr", deviceHardwareModel, nullptr, {dmi + "board_name", tree + "compatible"}},
      {"SerialNumber", deviceSerialNumber, nullptr, {dmi + "product_serial", tree + "serial-number"}},
  };
  for (const Fact& fact : facts) {
    SCOPED_TRACE(fact.key);
    testRoot().write("etc/os-release",
                     "XNAME=x\nNAME=\"Debian\" \nNAME=second\nVERSION_ID=\"12\"\nBUILD_ID='22F82'\n");
    testRoot().write(kFacts, std::string(fact.key) + "X = \"other\"\n");
    auto expected = firmwareFact(fact.key);  // this machine's own value
    if (!expected && fact.system) expected = fact.system;
    EXPECT_EQ(QNCopyAnswer(fact.key), expected);
    EXPECT_EQ(fact.getter(), expected ? std::optional<Text>(*expected) : std::nullopt);
    testRoot().write(kFacts, std::string(fact.key) + " = \"Küche 3,1\"\n");
    EXPECT_EQ(fact.getter(), Text("Küche 3,1"));

    TempDirectory machine;
    const std::string root = machine.path();
    EXPECT_EQ(firmwareFact(fact.key, root), std::nullopt);
    for (auto source = fact.firmware.rbegin(); source != fact.firmware.rend(); ++source) {
      const std::string below = firmwareFact(fact.key, root).value_or("");
      for (const char* filler : {"", " \n", "Default string", "Not Applicable", "Not Specified", "None",
                                 "O.E.M.", "System Product Name", "System Serial Number",
                                 "To Be Filled By O.E.M.", "To be filled by O.E.M.\n"}) {
        machine.write(*source, filler);
        EXPECT_EQ(firmwareFact(fact.key, root).value_or(""), below) << filler;
      }
      machine.write(*source, *source + ' ' + '\0' + "next");
      EXPECT_EQ(firmwareFact(fact.key, root), *source);
    }
  }
  testRoot().write(kFacts, "");
  for (const char* other : {"ReleaseType", "RegionCode", "NAME", "productVersion"})
    EXPECT_EQ(QNCopyAnswer(other), std::nullopt) << other;
}

TEST_F(Device, ReadsOSReleaseAsAShellWould) {
  using Case = std::tuple<const char*, const char*, std::optional<std::string>, std::optional<std::string>>;
  for (const auto& [file, text, version, build] :
       {Case{"etc", "ID=debian\nVERSION_ID=\"12\"\nVERSION=\"12 \\\"x\\\"\"\n", "12", "12 \"x\""},
        Case{"etc", "BUILD_ID='22\\F82'\nVERSION=x", std::nullopt, "22\\F82"},
        Case{"usr/lib", "VERSION_ID=12\r\nBUILD_ID=\"2\\\"", "12", "2\\"}}) {
    SetUp();
    testRoot().write(file + std::string("/os-release"), text);
    EXPECT_EQ(QNCopyAnswer("ProductVersion"), version) << text;
    EXPECT_EQ(QNCopyAnswer("BuildVersion"), build) << text;
  }
  testRoot().write("etc/os-release", "ID=x\n");
  EXPECT_EQ(QNCopyAnswer("ProductVersion"), std::nullopt) << "the first of both files counts";
}

TEST_F(Device, HasAnIdentifierThatIsDerivedFromItsMachineID) {
  // The first 20 bytes of SHA-256 over the label "com.corvane.veskreportingd device identifier 1\n" and the
  // ID.
  const std::pair<const char*, std::optional<std::string>> cases[] = {
      {"0123456789abcdef0123456789abcdef\n", "eb6b97fad7d9e901b07a262443f0076e84220993"},
      {"0123456789ABCDEF0123456789abcdef", "eb6b97fad7d9e901b07a262443f0076e84220993"},
      {"0123456789abcdef0123456789abcdee\n", "fb732696786bcd01ab8992021762846055100372"},
      {"uninitialized\n", std::nullopt},
      {"", std::nullopt},
      {"0123456789abcdef0123456789abcde\n", std::nullopt},
      {"0123456789abcdef0123456789abcdefa\n", std::nullopt},
      {"0123456789abcdef0123456789abcdeg\n", std::nullopt},
  };
  for (const auto& [machineID, identifier] : cases) {
    testRoot().write("etc/machine-id", machineID);
    EXPECT_EQ(QNCopyAnswer("UniqueDeviceID"), identifier) << machineID;
  }
}

TEST_F(Device, CopiesItsIdentifierIntoABuffer) {
  const std::string kept(50, 'x');
  const std::string identifier(40, 'a');
  const std::string facts = "UniqueDeviceID = \"" + identifier + "\"\n";
  // The buffer up to its end, and one byte more.
  using Case = std::tuple<std::string, std::size_t, std::string>;
  for (const auto& [fact, size, after] :
       {Case{"", 41, kept.substr(0, 42)}, Case{facts, 41, identifier + '\0' + 'x'},
        Case{facts, 40, '\0' + kept.substr(0, 38) + '\0' + 'x'}, Case{facts, 0, "x"}}) {
    testRoot().write(kFacts, fact);
    std::string buffer = kept;
    copyUniqueDeviceID(buffer.data(), size);
    EXPECT_EQ(buffer.substr(0, size + 1), after) << size;
  }
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
  EXPECT_EQ(at(1761440399), 7200);  // the last second of summer time
  EXPECT_EQ(at(1761440400), 3600);
  EXPECT_EQ(at(-1), 3600);
  ::setenv("TZ", "NST3:30", 1);
  EXPECT_EQ(at(1764016400), -12600);
  ::unsetenv("TZ");
}

TEST_F(Device, RunsAnInternalBuildOnlyWhenItSaysSoAndForGood) {
  // The first result is kept for the life of the process, so each case needs its own process.
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
  const std::pair<Dictionary, const char*> cases[] = {
      {{{"clientName", "MyApp"}, {"serviceName", "Calls"}}, "myapp:calls"},
      {{{"serviceName", "ÄCalls"}}, ":äcalls"},
      {{{"clientName", "ΑΣ"}, {"serviceName", "İ:ẞ"}}, "ας:i̇:ß"},
      {{{"clientName", ""}}, ":"},
      {{{"clientName", 5}, {"serviceName", Value()}, {"ClientName", "x"}}, ":"},
      {{}, ":"},
  };
  for (const auto& [userInfo, key] : cases) EXPECT_EQ(correlationKeyForUserInfo(userInfo), key);
}

TEST(ReportingdUtil, ConvertsTimesAndNumbers) {
  const std::pair<timeval, double> times[] = {{{1, 500'000}, 1.5},
                                              {{0, 1}, 1e-6},
                                              {{-2, 250'000}, -1.75},
                                              {{2'147'483'647, 999'999}, 2147483647.999999}};
  for (const auto& [time, seconds] : times) EXPECT_EQ(secondsFromTimeval(time), seconds);
  const std::pair<double, double> numbers[] = {{NAN, -1.0},  {HUGE_VAL, -1.0}, {-HUGE_VAL, -1.0},
                                               {3.25, 3.25}, {-1.0, -1.0},     {0.0, 0.0}};
  for (const auto& [number, shown] : numbers) EXPECT_EQ(finiteOrMinusOne(number), shown) << number;
}

TEST(ReportingdUtil, EncodesWhatAQueryMayNotHold) {
  const std::string unreserved =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-._~!$&'()*+,;=:@/?";
  EXPECT_EQ(encodedForURLQuery(unreserved), unreserved);
  EXPECT_EQ(encodedForURLQuery(" #%[]\"\\\n<>^`{|}\x7f\xc3\xa9"),
            "%20%23%25%5B%5D%22%5C%0A%3C%3E%5E%60%7B%7C%7D%7F%C3%A9");
  EXPECT_EQ(encodedForURL(unreserved + "#[]%20 \"\xc3\xa9"), unreserved + "#[]%20%20%22%C3%A9");
}

TEST(SamplingDraw, FollowsTheDefaultSequence) {
  // The values of drand48 in a program that never seeds it.
  EXPECT_NEAR(nextSamplingDraw(), 0.0, 1e-9);
  EXPECT_NEAR(nextSamplingDraw(), 0.000985394675650, 1e-12);
  EXPECT_NEAR(nextSamplingDraw(), 0.041631001594613, 1e-12);
}

}  // namespace
}  // namespace vesk::test
