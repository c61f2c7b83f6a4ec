// How an HTTPS backend interprets its profile: whether it reports, for which client, where to and how.
#include "backends/BackendFactory.h"
#include "tests/support/HTTPSBackendTest.h"
#include "tests/support/TestRoot.h"

namespace vesk::test {
namespace {

constexpr const char* kUpdate = "HTTPSPostBackend(updateBackendState): ";

void writePreferences(std::string_view toml) {
  testRoot().write("etc/veskreporting/preferences/com.corvane.veskreporting.toml", toml);
}

using HTTPSPolicy = HTTPSBackendTest;

TEST_F(HTTPSPolicy, EntryDecidesTheState) {
  // value: nullopt: the entry lacks the key
  const std::tuple<const char*, std::optional<Value>, std::int32_t, Lines> cases[] = {
      {"locale_whitelist", List{"DE", "s"}, 2, {}},
      {"locale_whitelist", List{"DE", "FR"}, 1, {"7 (US) isn't in locale list (DE, FR)"}},
      {"locale_whitelist", List{"USA"}, 1, {}},
      {"locale_whitelist", List{}, 1, {}},
      {"locale_whitelist", std::nullopt, 1, {"7 (US) isn't in locale list ()"}},
      {"locale_whitelist", "US", 1, {}},
      {"device_whitelist", List{"Pad", "pho"}, 2, {}},
      {"device_whitelist", List{"Pad"}, 1, {"7 (Phone) isn't in device list (Pad)"}},
      {"device_whitelist", List{}, 2, {}},
      {"device_whitelist", "Phone", 1, {}},
      {"device_whitelist", List{7, true}, 1, {}},
      {"device_whitelist", List{7, "Pad"}, 1, {"7 (Phone) isn't in device list (Pad)"}},
      {"device_whitelist", List{7, "Phone"}, 2, {}},
      {"filters", std::nullopt, 1, {"4 filters are required."}},
      {"filters", 7, 1, {"4 filters are required."}},
      {"post_url", 7, 2, {}}};
  for (const auto& [key, value, state, lines] : cases) {
    CapturedLog log;
    const Dictionary changes = value ? Dictionary{{key, *value}} : Dictionary();
    EXPECT_EQ(make(entry(changes, value ? "" : key))->state(), state) << describe(changes);
    EXPECT_EQ(lines.empty() ? lines : linesOf(log, kUpdate), lines);
    const bool isWrong = describe(changes).find('7') != std::string::npos;
    EXPECT_EQ(log.countContaining(4, "' has the wrong type and counts as absent: 7"), isWrong ? 1 : 0);
  }
  harness.region.reset();
  EXPECT_EQ(make(entry())->state(), BackendStateEnabled) << "an unknown region passes";
}

TEST_F(HTTPSPolicy, NamesChooseTheEntry) {
  // client, service: of the user; null: unknown
  // names: required by the entry
  const std::tuple<Value, Value, Dictionary, bool> cases[] = {
      {"a", "b", {}, true},
      {"STRASSE", "x", {{"client", "a,straße"}}, true},
      {"ab", "x", {{"client", "a,b"}}, false},
      {"a", "MyCallService", {{"service", "mail,cALL"}}, true},
      {"a", "MyCallService", {{"client", "a"}, {"service", "mail,"}}, false},
      {"c", "call", {{"client", "a"}, {"service", "call"}}, false},
      {nullptr, nullptr, {}, true},
      {nullptr, nullptr, {{"client", "a"}}, false},
      {"a", nullptr, {{"service", "x"}}, false},
      {nullptr, "x", {{"service", "x"}}, true},
      {"a", "b", {{"client", List{"a"}}}, false},
      {"a", "b", {{"service", 7}}, false}};
  for (const auto& [client, service, names, matches] : cases) {
    const Dictionary user{{kVeskReportingUserInfoClientName, client},
                          {kVeskReportingUserInfoServiceName, service}};
    const auto state = matches ? BackendStateEnabled : BackendStateDisabled;
    EXPECT_EQ(make(entry(names), {.userInfo = user})->state(), state) << describe(user);
  }
}

TEST_F(HTTPSPolicy, FirstMatchingEntryDecidesEachTimeAnew) {
  harness.consent = false;
  auto backend = make(List{"no entry", entry({{"client", "A"}, {"hierarchy", 1}, {"override_dnu", 1}}),
                           entry({{"client", "B"}, {"hierarchy", 2.5}}),
                           entry({{"client", "C"}, {"hierarchy", 4e9}, {"override_dnu", true}}),
                           entry({{"client", "A,D"}, {"override_dnu", 1}})},
                      {.userInfo = std::nullopt});
  EXPECT_EQ(backend->state(), BackendStatePending) << "no user info yet";
  const std::tuple<const char*, std::int32_t, std::int32_t> cases[] = {
      {"A", 2, 1}, {"B", 1, 2}, {"C", 2, 2'147'483'647}, {"D", 2, 0}, {"E", 1, 0}, {"A", 2, 1}};
  for (const auto& [client, state, hierarchy] : cases) {
    update(*backend, userNamed(client));
    EXPECT_EQ(backend->state(), state) << client;
    EXPECT_EQ(backend->hierarchy(), hierarchy) << "also where consent is missing";
  }
}

TEST_F(HTTPSPolicy, ExpediteOfTheFirstMatchDecidesOnBatching) {
  const std::tuple<bool, List, bool> cases[] = {
      {true, {entry({{"expedite", 1}})}, false},
      {false, {entry({{"expedite", 0}})}, true},
      {true, {entry({{"client", "Other"}, {"expedite", 1}}), entry()}, true},
      {false, {entry(), entry({{"expedite", 0}})}, false}};
  for (const auto& [batchEvents, clients, holds] : cases) {
    for (const bool requireUserInfo : {true, false}) {
      send(*make(clients, {.requireUserInfo = requireUserInfo, .batchEvents = batchEvents}));
      EXPECT_EQ(takeTargets(), holds ? Lines{} : Lines{"/post 1"}) << describe(clients);
    }
  }
}

TEST_F(HTTPSPolicy, ConsentIsRespectedUnlessTheStorebagOverridesIt) {
  const std::tuple<bool, Value, std::int32_t, std::int32_t, Lines> cases[] = {
      {true, 2, 2, 0, {}},
      {true, 1, 2, 2, {}},
      {false, 1, 2, 1, {}},
      {false, 2, 1, 0, {"7 reporting disabled by DNU: 2."}},
      {false, "1", 1, 0, {"7 reporting disabled by DNU: 0."}}};
  for (const auto& [consent, override, state, option, lines] : cases) {
    harness.consent = consent;
    // Consent was overridden before, for another client.
    auto backend =
        make(List{entry({{"client", "Before"}, {"override_dnu", 1}}), entry({{"override_dnu", override}})},
             {.userInfo = userNamed("Before")});
    CapturedLog log;
    update(*backend, userNamed("Camera"));
    EXPECT_EQ(backend->state(), state);
    EXPECT_EQ(state == BackendStateDisabled ? linesOf(log, kUpdate) : lines, lines);
    backend->setState(BackendStateEnabled);
    EXPECT_EQ(sendStop(*backend).has_value(), consent && option == 0) << "for the local log";
    const auto post = take();
    EXPECT_EQ(post.event().at("Opt"), option);
    EXPECT_EQ(post.body.at("clientId"), option == 0 ? "id-respecting" : "id-overriding");
  }
}

TEST_F(HTTPSPolicy, SamplingChoosesReportingOrTheOverrideBand) {
  // sampling, override: null: absent
  // sentSampling, sentOverride: in the message that ends the session
  const std::tuple<Value, Value, std::int32_t, boost::json::value, boost::json::value> cases[] = {
      {0.30, nullptr, 2, 0.30, -1}, {1, 0.75, 2, 1, -1},       {0.29, nullptr, 3, 0.29, -1},
      {0.1, 0.30, 3, 0.1, 0.30},    {0.1, 0.29, 1, 0.1, 0.29}, {nullptr, 0.75, 1, -1, -1},
      {"high", 0.75, 1, -1, -1},    {0.1, "0.30", 1, 0.1, -1}};
  for (const auto& [sampling, override, state, sentSampling, sentOverride] : cases) {
    MutableDictionary whole(entry({}, "sampling_threshold"));
    if (!sampling.isNone()) whole.set("sampling_threshold", sampling);
    if (!override.isNone()) whole.set("override_sampling", override);
    auto backend = make(whole.share());
    EXPECT_EQ(backend->state(), state) << describe(sampling);
    backend->setState(BackendStateEnabled);
    sendStop(*backend);
    const auto event = take().event();
    EXPECT_EQ(event.at("SamplingThreshold"), sentSampling);
    EXPECT_EQ(event.at("OverrideSampling"), sentOverride);
  }
}

TEST_F(HTTPSPolicy, LaterEntriesKeepWhatTheyDoNotReach) {
  auto backend = make(List{entry({{"client", "Camera"},
                                  {"filters", List{Dictionary{{"key", "secret"}, {"action", "remove"}}}},
                                  {"sampling_threshold", 0.1},
                                  {"override_sampling", 0.2},
                                  {"event_threshold", 7},
                                  {"extras_on_internal", 1}}),
                           entry({{"client", "EmptyFilters"}, {"filters", List{}}}, "post_url"),
                           entry({{"client", "NoFilters"}, {"post_url", "ftp://never/"}}, "filters"),
                           entry({{"client", "NoSampling"}}, "sampling_threshold")},
                      {.isInternal = true});
  const std::tuple<const char*, boost::json::value, bool> cases[] = {
      {"EmptyFilters", 1.0, true}, {"NoFilters", 1.0, true}, {"NoSampling", -1, false}};
  CapturedLog log;
  for (const auto& [client, sampling, hides] : cases) {
    SCOPED_TRACE(client);
    update(*backend, userNamed(client));
    backend->setState(BackendStateEnabled);
    sendStop(*backend, Dictionary{{"secret", 1}});
    const auto post = take();
    EXPECT_EQ(post.event().at("SamplingThreshold"), sampling);
    EXPECT_EQ(post.event().at("OverrideSampling"), 0.2);
    EXPECT_EQ(post.event().contains("secret"), !hides);
    EXPECT_EQ(post.request.target, "/post");
    EXPECT_EQ(post.body.at("clientId"), "the-udid") << "extras on internal stay";
  }
  EXPECT_EQ(log.countContaining(7, "defaulting to 49"), 2) << "but the threshold of events falls back";
}

TEST_F(HTTPSPolicy, PostsGoToTheStorebagsURLsUnlessThePreferencesNameOthers) {
  // preference, storebag, storebagRealtime: "": none
  // ordinary, realtime: targets of the posts; "": none
  const std::tuple<std::string, std::string, std::string, std::string, std::string> cases[] = {
      {"", "/s", "/sr", "/s", "/sr"},
      {"", "/s", "", "/s", "/s"},
      {"", "", "/sr", "", "/sr"},
      {"", "", "", "", ""},
      {"httpsPostURL", "/s", "/sr", "/mine", "/sr"},
      {"httpsPostURL", "/s", "", "/mine", "/mine"},
      {"httpsRealtimePostURL", "/s", "/sr", "/s", "/mine"}};
  for (const auto& [preference, storebag, storebagRealtime, ordinary, realtime] : cases) {
    for (const bool requireUserInfo : {true, false}) {
      if (!preference.empty()) writePreferences(preference + " = \"" + harness.url("/mine") + "\"\n");
      MutableDictionary whole(entry({}, "post_url"));
      whole.remove("realtime_post_url");
      if (!storebag.empty()) whole.set("post_url", harness.url(storebag));
      if (!storebagRealtime.empty()) whole.set("realtime_post_url", harness.url(storebagRealtime));
      auto backend = make(whole.share(), {.requireUserInfo = requireUserInfo});
      writePreferences("");
      backend->updateState();  // preferences are read once and survive the storebag's updates
      for (const auto& [flag, target] : {std::pair(0, ordinary), {1, realtime}}) {
        send(*backend, Dictionary(), 3, flag);
        EXPECT_EQ(takeTargets(), target.empty() ? Lines{} : Lines{target + " 1"});
      }
    }
  }
  EXPECT_EQ(harness.dropped(DropReason::NoURL), 6u);
}

TEST_F(HTTPSPolicy, WithoutRequiredUserInfoOnlyTheFirstPostURLCounts) {
  harness.consent = false;
  auto backend = make(List{Dictionary{{"extras_on_internal", 0}, {"client", "Nobody"}},
                           Dictionary{{"post_url", harness.url("/second")},
                                      {"sampling_threshold", 0.0},
                                      {"hierarchy", 4},
                                      {"extras_on_internal", 1}},
                           Dictionary{{"post_url", harness.url("/third")}, {"extras_on_internal", 0}}},
                      {.requireUserInfo = false, .isInternal = true});
  EXPECT_EQ(backend->state(), BackendStateEnabled) << "whatever the draw and the consent";
  EXPECT_EQ(backend->hierarchy(), 0);
  send(*backend, Dictionary(), 3, MessageFlagRealtime);
  const auto post = take();
  EXPECT_EQ(post.request.target, "/second");
  EXPECT_EQ(post.body.at("clientId"), "the-udid");
}

TEST_F(HTTPSPolicy, TellsEachStepOfItsDecision) {
  const std::tuple<const char*, Dictionary, Stamp, Lines> cases[] = {
      {"",
       entry({{"expedite", 0},
              {"sampling_threshold", 0.1},
              {"override_sampling", 0.2},
              {"event_threshold", 3e9},
              {"extras_on_internal", 2},
              {"post_url", "http://a/"},
              {"realtime_post_url", "http://b/"}}),
       {},
       {"7 Store bag override  _batchEvent=1", "7 event_threshold set to 2147483647",
        "7 extras on internal is set to 2", "7 httpPost: client found Camera, state? 1, 0.300000",
        "7 Storebag 'http://a/' for postURL", "7 Storebag 'http://b/' for realtimePostURL"}},
      {"httpsPostURL = \"http://c/\"\n",
       entry({{"expedite", 7}}, "realtime_post_url"),
       {.userInfo = Dictionary()},
       {"7 HTTPSPostBackend(initWithName): Using user default 'http://c/' for postURL",
        "7 Store bag override  _batchEvent=0",
        "7 event_threshold value not found in storebag - defaulting to 49",
        "7 httpPost: client found (none), state? 2, 0.300000",
        "7 realtimePostURL defaults to postURL 'http://c/'"}},
      {"httpsRealtimePostURL = \"http://d/\"\n",
       Dictionary{{"extras_on_internal", 1}, {"post_url", "http://e/"}},
       {.requireUserInfo = false},
       {"7 HTTPSPostBackend(initWithName): Using user default 'http://d/' for realtimePostURL",
        "7 Storebag 'http://e/' for postURL", "7 extras on internal is set to 1"}},
      {"", {}, {.requireUserInfo = false}, {"7 realtimePostURL defaults to postURL '(none)'"}}};
  for (const auto& [preferences, entry, stamp, lines] : cases) {
    writePreferences(preferences);
    CapturedLog log;
    make(entry, stamp);
    writePreferences("");
    EXPECT_EQ(linesOf(log, kUpdate), lines);
  }
}

TEST(PostPolicy, NamesTheFirstRuleThatHeldReportingBack) {
  const Dictionary whole{{"client", "Camera"},
                         {"locale_whitelist", List{"us"}},
                         {"device_whitelist", List{"phone"}},
                         {"filters", List{}},
                         {"sampling_threshold", 0.5}};
  const PostPolicy::Facts all{.userInfo = userNamed("Camera"),
                              .requireUserInfo = true,
                              .productFamily = "Phone",
                              .regionCode = "US",
                              .dnuEnabled = true,
                              .samplingFactor = 0.3};
  const std::tuple<Dictionary, std::int32_t, const char*> cases[] = {
      {{}, 2, ""},
      {{{"client", "A,B"}}, 1, "clients: \"Camera\", wanted null"},
      {{{"locale_whitelist", List{"FR", "DE"}}},
       1,
       "locale_whitelist of entry 1: \"US\", wanted [\"FR\", \"DE\"]"},
      {{{"device_whitelist", List{"Pad"}}}, 1, "device_whitelist of entry 1: \"Phone\", wanted [\"Pad\"]"},
      {{{"filters", 7}}, 1, "filters of entry 1: null, wanted null"},
      {{{"sampling_threshold", 0.1}}, 3, "sampling_threshold of entry 1: 0.3, wanted 0.1"}};
  for (const auto& [changes, state, reason] : cases) {
    MutableDictionary changed(whole);
    changed.setAll(changes);
    PostPolicy::Facts facts = all;
    facts.profile = Dictionary{{"clients", List{Dictionary{{"service", "none"}}, changed.share()}}};
    const auto decision = PostPolicy::decide(facts, {});
    EXPECT_EQ(decision.state, state);
    const auto* step = decision.reason();
    EXPECT_EQ(!step ? ""
                    : std::string(step->rule) +
                          (step->entry ? " of entry " + std::to_string(*step->entry) : "") + ": " +
                          describe(step->value) + ", wanted " + describe(step->expected),
              reason);
  }
}

TEST_F(HTTPSPolicy, FactoryKnowsSixNames) {
  CapturedLog log;
  const Dictionary profile{{"clients", List{Dictionary()}},
                           {"ip", "127.0.0.1"},
                           {"port", 9},
                           {"post_url", "http://upload/"},
                           {"display_url", "http://display/"}};
  const auto built = [&](const char* name, const std::optional<Dictionary>& with,
                         const std::optional<Text>& family = Text("Phone")) {
    return newBackendWithName(name, with, {._compType = 7, ._productFamily = family}, harness.services);
  };
  for (const char* name : {"httpPost", "httpPost2", "dashboard", "uploadServer", "kilnar", "wren"}) {
    const auto backend = built(name, profile);
    ASSERT_TRUE(backend) << name;
    EXPECT_EQ(backend->name(), name);
    EXPECT_EQ(backend->state(), BackendStatePending);
    const bool isHTTPS = std::dynamic_pointer_cast<HTTPSPostBackend>(backend) != nullptr;
    EXPECT_EQ(isHTTPS, std::string_view(name).starts_with("httpPost"));
    EXPECT_TRUE(!isHTTPS || backend->displayURL() == "http://display/");
  }
  EXPECT_EQ(linesOf(log), Lines{});
  EXPECT_FALSE(built("carrierPigeon", profile));
  EXPECT_FALSE(built("httpPost", std::nullopt));
  EXPECT_FALSE(built("httpPost", Dictionary{{"clients", "none"}}));
  for (const char* name : {"httpPost2", "httpPost"}) EXPECT_FALSE(built(name, profile, std::nullopt));
  testRoot().write("etc/veskreporting/device.toml", "ProductType = \"Bramble\"\n");
  EXPECT_FALSE(built("wren", profile));
  testRoot().write("etc/veskreporting/device.toml", "");
  EXPECT_EQ(
      linesOf(log),
      (Lines{"3 VeskReportingBackend(newBackendWithName): carrierPigeon",
             "3 HTTPSPostBackend(initWithName): can't find the client list.",
             "4 HTTPSPostBackend(initWithName): the device has no product family (DeviceName), so there "
             "is no backend httpPost2",
             "3 VeskReportingBackend(newBackendWithName): wren"}));
}

}  // namespace
}  // namespace vesk::test
