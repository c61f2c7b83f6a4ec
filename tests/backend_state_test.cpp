// How an HTTPS backend decides from its profile whether it reports.
#include <gtest/gtest.h>

#include "backends/HTTPSPostBackend.h"
#include "backends/ListMatching.h"
#include "tests/support/BackendHarness.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/TestRoot.h"

namespace vesk::test {
namespace {

TEST(ListMatching, SpecialCasesAndCase) {
  struct Case {
    NameList list;
    std::optional<std::string_view> string;
    bool whitelist, exact, fragment;
  };
  using Names = std::vector<std::string>;
  const Case cases[] = {
      {std::nullopt, "x", true, true, true},
      {std::nullopt, std::nullopt, false, false, false},
      {Names{}, "x", true, true, true},
      {Names{"a"}, std::nullopt, true, false, false},
      {Names{"a"}, std::nullopt, false, true, true},
      {Names{"a", "b"}, "B", true, true, true},
      {Names{"a", "b"}, "ab", true, false, true},
      {Names{"call"}, "MyCallService", true, false, true},
      {Names{""}, "x", true, false, false},
      {Names{"straße"}, "STRASSE", false, true, true},
  };
  for (const auto& test : cases) {
    SCOPED_TRACE(test.string.value_or("(none)"));
    EXPECT_EQ(matchExactStringWithList(test.list, test.string, test.whitelist), test.exact);
    EXPECT_EQ(matchStringWithList(test.list, test.string, test.whitelist), test.fragment);
  }
}

class BackendState : public ::testing::Test {
 protected:
  std::shared_ptr<VeskReportingBackend> make(List clients, bool requireUserInfo = true) {
    auto backend = VeskReportingBackend::newBackendWithName(kVeskReportingBackendHTTPPost,
                                                            Dictionary{{"clients", std::move(clients)}},
                                                            Text("Phone"), 5, harness.services);
    backend->setRequireUserInfo(requireUserInfo);
    backend->setUserInfoDict(Dictionary{{kVeskReportingUserInfoClientName, "Camera"},
                                        {kVeskReportingUserInfoServiceName, "MyCallService"}});
    backend->setSamplingFactor(0.30);
    backend->updateState();
    return backend;
  }
  static Dictionary entry(Dictionary changes = {}, std::string_view without = "") {
    MutableDictionary whole(Dictionary{{"locale_whitelist", List{"us"}},
                                       {"filters", List{Dictionary{{"key", "x"}}}},
                                       {"sampling_threshold", 1.0}});
    whole.setAll(changes);
    whole.remove(without);
    return whole.share();
  }

  BackendHarness harness;
};

TEST_F(BackendState, FollowsTheMatchingEntry) {
  const struct {
    const char* name;
    Dictionary entry;
    std::int32_t state;
    int level = 0;
    const char* line = nullptr;  // after the name of the function
  } cases[] = {
      {"all allowed", entry(), 2},
      {"client by name", entry({{"client", "Phone,camera"}}), 2},
      {"client is no fragment", entry({{"client", "Cam"}}), 1},
      {"service by fragment", entry({{"service", "mail,call"}}), 2},
      {"other service", entry({{"service", "mail"}}), 1},
      {"other region", entry({{"locale_whitelist", List{"DE", "FR"}}}), 1, 7,
       "(US) isn't in locale list (DE, FR)"},
      {"empty region list", entry({{"locale_whitelist", List{}}}), 1},
      {"no region list", entry({}, "locale_whitelist"), 1},
      {"device by fragment", entry({{"device_whitelist", List{"pho"}}}), 2},
      {"other device", entry({{"device_whitelist", List{"Pad"}}}), 1, 7,
       "(Phone) isn't in device list (Pad)"},
      {"empty device list", entry({{"device_whitelist", List{}}}), 2},
      {"no filters", entry({}, "filters"), 1, 4, "filters are required."},
      {"no sampling", entry({}, "sampling_threshold"), 1},
      {"draw at the threshold", entry({{"sampling_threshold", 0.30}}), 2},
      {"draw above, no override", entry({{"sampling_threshold", 0.29}}), 3},
      {"draw inside override", entry({{"sampling_threshold", 0.1}, {"override_sampling", 0.30}}), 3},
      {"draw outside override", entry({{"sampling_threshold", 0.1}, {"override_sampling", 0.20}}), 1},
      {"override of a wrong type", entry({{"sampling_threshold", 0.1}, {"override_sampling", "0.30"}}), 1},
      {"threshold of a wrong type", entry({{"sampling_threshold", "high"}}), 1},
      {"filters of a wrong type", entry({{"filters", 7}}), 1},
      {"client of a wrong type", entry({{"client", List{"Camera"}}}), 1},
      {"service of a wrong type", entry({{"service", 7}}), 1},
      {"device of a wrong type", entry({{"device_whitelist", "Phone"}}), 1},
      {"devices of a wrong type", entry({{"device_whitelist", List{7}}}), 1},
      {"huge threshold", entry({{"event_threshold", 3e9}}), 2, 7, "event_threshold set to 2147483647"},
      {"threshold", entry({{"event_threshold", 7}}), 2, 7, "event_threshold set to 7"},
      {"no threshold", entry(), 2, 7, "event_threshold value not found in storebag - defaulting to 49"},
      {"expedite", entry({{"expedite", 1}}), 2, 7, "Store bag override  _batchEvent=0"},
      {"summary", entry(), 2, 7, "httpPost: client found Camera, state? 2, 0.300000"},
  };
  for (const auto& test : cases) {
    SCOPED_TRACE(test.name);
    CapturedLog log;
    auto backend = make(List{test.entry});
    EXPECT_EQ(backend->state(), test.state);
    if (test.line) {
      EXPECT_EQ(log.count(test.level, std::string("HTTPSPostBackend(updateBackendState): ") + test.line), 1);
    }
  }
}

TEST_F(BackendState, AnUnknownRegionPasses) {
  harness.region.reset();
  auto backend = make(List{entry()});
  EXPECT_EQ(backend->state(), BackendStateEnabled);
}

TEST_F(BackendState, ConsentIsRespectedUnlessTheStorebagOverridesIt) {
  const struct {
    bool consent;
    std::optional<int> override;
    std::int32_t state;
    const char* clientId;
    bool printable;
  } cases[] = {{true, std::nullopt, 2, "id-respecting", true},
               {true, 1, 2, "id-overriding", false},
               {false, 1, 2, "id-overriding", false},
               {false, std::nullopt, 1, "", false},
               {false, 2, 1, "", false}};
  for (const auto& test : cases) {
    SCOPED_TRACE(test.clientId);
    CapturedLog log;
    harness.consent = test.consent;
    auto changes = Dictionary{{"post_url", harness.url()}};
    if (test.override) changes = Dictionary{{"post_url", harness.url()}, {"override_dnu", *test.override}};
    auto backend = make(List{entry(changes)});
    EXPECT_EQ(backend->state(), test.state);
    auto printable = backend->sendMessage(Dictionary{{"a", 1}}, timeval{}, 1, 0, 0);
    EXPECT_EQ(printable.has_value(), test.printable);
    if (test.state == 2) {
      EXPECT_EQ(harness.posts().back().body.at("clientId"), test.clientId);
    }
    if (test.state == 1) {
      EXPECT_EQ(log.count(7, "HTTPSPostBackend(updateBackendState): reporting disabled by DNU: " +
                                 std::to_string(test.override.value_or(0)) + "."),
                1);
    }
  }
}

TEST_F(BackendState, WithoutRequiredUserInfoOnlyTheFirstPostURLCounts) {
  auto backend = make(List{Dictionary{{"extras_on_internal", 1}, {"client", "Nobody"}},
                           Dictionary{{"post_url", "http://second/"}, {"sampling_threshold", 0.0}},
                           Dictionary{{"post_url", "http://third/"}}},
                      false);
  EXPECT_EQ(backend->state(), BackendStateEnabled) << "whatever the draw";
  EXPECT_EQ(std::static_pointer_cast<HTTPSPostBackend>(backend)->postURL(), "http://second/");
}

TEST_F(BackendState, ThresholdFallsBackWhenALaterEntryHasNone) {
  CapturedLog log;
  auto backend = make(List{entry({{"client", "Camera"}, {"event_threshold", 7}}), entry()});
  backend->setUserInfoDict(Dictionary{{kVeskReportingUserInfoClientName, "Other"}});
  backend->updateState();
  EXPECT_EQ(log.countContaining(7, "defaulting to 49"), 1);
}

TEST_F(BackendState, UnusableProfilesGiveNoBackend) {
  CapturedLog log;
  auto make = [&](const char* name, std::optional<Dictionary> profile, std::optional<Text> family) {
    return VeskReportingBackend::newBackendWithName(name, profile, family, 5, harness.services);
  };
  EXPECT_EQ(make(kVeskReportingBackendHTTPPost, Dictionary(), Text("Phone")), nullptr);
  EXPECT_EQ(log.count(3, "HTTPSPostBackend(initWithName): can't find the client list."), 1);
  EXPECT_EQ(make(kVeskReportingBackendHTTPPost, std::nullopt, Text("Phone")), nullptr);
  EXPECT_EQ(make(kVeskReportingBackendHTTPPost, Dictionary{{"clients", List{}}}, std::nullopt), nullptr);
  EXPECT_EQ(make("carrierPigeon", Dictionary(), Text("Phone")), nullptr);
  EXPECT_EQ(log.count(3, "VeskReportingBackend(newBackendWithName): carrierPigeon"), 1);
}

TEST_F(BackendState, PreferencesOverrideTheStorebagsURLs) {
  testRoot().write("etc/veskreporting/preferences/com.corvane.veskreporting.toml",
                   "httpsPostURL = \"http://mine/\"\n");
  auto backend =
      std::static_pointer_cast<HTTPSPostBackend>(make(List{entry({{"post_url", "http://theirs/"}})}));
  testRoot().write("etc/veskreporting/preferences/com.corvane.veskreporting.toml", "");
  backend->updateState();
  EXPECT_EQ(backend->postURL(), "http://mine/");
}

}  // namespace
}  // namespace vesk::test
