// A message's event: its record, its filters, and its JSON form.
#include <cstdio>

#include "backends/BackendFactory.h"
#include "tests/support/HTTPSBackendTest.h"
#include "tests/support/TestRoot.h"

namespace vesk::test {
namespace {

constexpr double kInfinity = std::numeric_limits<double>::infinity();

using HTTPSEvent = HTTPSBackendTest;

TEST_F(HTTPSEvent, RecordIsThePayloadUnderTheComputedFieldsUnderTheUserInfo) {
  auto backend = make(entry(), {.userInfo = Dictionary{{"clientName", "Camera"}, {"_osVersion", "mine"}}});
  harness.clock.set(1'700'000'000.25);
  send(*backend, Dictionary{{"text", "häß"}, {"n", -7}, {"x", 2.5}, {"_method", "mine"}, {"_build", "mine"}});
  EXPECT_EQ(take().request.decodedBody().body,
            R"({"postTime":1700000000.25,"clientId":"id-respecting","events":[{"text":"häß","n":-7,"x":2.5,)"
            R"("_method":3,"_startTS":999999960,"_sender":"HD","_clientVersion":3,)"
            R"("_sessionID":"session-text","_eventNumber":1,"_status":2,"_clientTS":999999965.25,)"
            R"("eventTime":999999965.25,"_productFamily":"Phone","_productModel":"Phone7,2",)"
            R"("_osVersion":"mine","_internal":2,"_reportVers":"7.2","_timezoneOffset":0,)"
            R"("clientName":"Camera"}]})")
      << "an unknown build is left out, also where the payload has one";
  backend = make(entry(), {.build = Text("16B92")});
  backend->setCombinedSessionIDString(std::nullopt);
  send(*backend, Dictionary{{"_sessionID", "mine"}});
  const auto event = take().event();
  EXPECT_EQ(event.at("_build"), "16B92");
  EXPECT_FALSE(event.contains("_sessionID"));
}

TEST_F(HTTPSEvent, TimesCountFromTheMinuteOfTheStart) {
  const std::tuple<double, double, std::int64_t, double> cases[] = {
      {59.5, 60, 0, 0.5},
      {60, 60, 60, 60},
      {119.5, 119.25, 60, 59.75},
      {-61.5, -60.5, -60, -59},
      {5e9, 5e9 + 1, 2'147'483'640, 2'147'483'641},
      {-5e9, -5e9, -2'147'483'640, -2'147'483'640}};
  for (const auto& [start, message, startTS, clientTS] : cases) {
    make(entry(), {.start = start})->sendMessage(Dictionary(), at(message), 3, 2, 0);
    const auto event = take().event();
    EXPECT_EQ(event.at("_startTS"), startTS);
    for (const char* key : {"_clientTS", "eventTime"}) EXPECT_EQ(event.at(key), clientTS) << key;
  }
}

TEST_F(HTTPSEvent, SelfVersionHasTwoPartsOfEightBits) {
  for (const auto& [version, sent] :
       {std::pair("7", "7.0"), {"7.2.9", "7.2"}, {"300.257", "44.1"}, {"x.3", "0.3"}, {"", "0.0"}}) {
    send(*make(entry(), {.selfVersion = version}));
    EXPECT_EQ(take().event().at("_reportVers"), sent);
  }
}

TEST_F(HTTPSEvent, NumbersWrap) {
  auto backend = make(entry());
  backend->setState(BackendStateDisabled);
  for (int i = 0; i < 65534; ++i) send(*backend);
  EXPECT_EQ(harness.dropped(DropReason::StateDisabled), 65534u);
  backend->updateState();
  for (int number : {65535, 0, 1}) {
    send(*backend);
    EXPECT_EQ(take().event().at("_eventNumber"), number);
  }
}

// Environment and kind of build are determined once per process.
void tellEnvironment(const char* preferences, const char* facts, const char* zone) {
  testRoot().write("etc/veskreporting/preferences/com.corvane.veskreporting.toml", preferences);
  testRoot().write("etc/veskreporting/device.toml", facts);
  ::setenv("TZ", zone, 1);
  BackendHarness harness;
  const Dictionary profile{{"clients", List{Dictionary{{"post_url", harness.url()}}}}};
  auto backend = newBackendWithName("httpPost", profile, {._productFamily = Text("Phone")}, harness.services);
  backend->updateState();
  backend->sendMessage(Dictionary(), at(0), 3, 2, 0);
  const auto event = harness.posts().at(0).event();
  std::filesystem::remove_all(testRoot().path());
  std::fprintf(stderr, "internal %d offset %d.\n", event.at("_internal").to_number<int>(),
               event.at("_timezoneOffset").to_number<int>());
  std::_Exit(0);
}

TEST(HTTPSEventDeathTest, TellsEnvironmentAndTimeZone) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");  // each in a process that has not determined them yet
  const char* release = "environmentType = 4\n";
  const char* internal = "ReleaseType = \"Internal\"\n";
  const auto exits = testing::ExitedWithCode(0);
  EXPECT_EXIT(tellEnvironment(release, "", "AAA-5:30"), exits, "internal 0 offset 19800\\.");
  EXPECT_EXIT(tellEnvironment(release, internal, "AAA3"), exits, "internal 1 offset -10800\\.");
  EXPECT_EXIT(tellEnvironment("", internal, "AAA0"), exits, "internal 2 offset 0\\.");
}

TEST_F(HTTPSEvent, InternalBuildsTellMoreWhereTheStorebagAsks) {
  const std::tuple<int, bool, std::int32_t, const char*, boost::json::value, const char*> cases[] = {
      {1, true, 7, "the-udid", 4'000'000'000, "the-udid"},
      {-1, true, 8, "the-udid", "session-text", "the-udid"},
      {0, true, 7, "the-udid", "session-text", "id-respecting"},
      {1, false, 7, "the-udid", "session-text", "id-respecting"},
      {1, true, 7, "", 4'000'000'000, "id-respecting"}};
  for (const auto& [extras, isInternal, clientType, udid, sessionID, clientId] : cases) {
    send(*make(entry({{"extras_on_internal", extras}}),
               {.isInternal = isInternal, .clientType = clientType, .udid = udid}));
    const auto post = take();
    EXPECT_EQ(post.event().at("_sessionID"), sessionID);
    EXPECT_EQ(post.body.at("clientId"), clientId);
    EXPECT_EQ(post.request.header("X-Vesk-Internal-Build").has_value(), isInternal);
  }
}

TEST_F(HTTPSEvent, LastMessageTellsHowItWasSampled) {
  const std::string adding =
      "7 HTTPSPostBackend(sendMessage): Adding dnu type and sampling threshold to SESSION_TYPE_STOP message "
      "dictionary";
  for (bool batch : {false, true}) {
    auto backend = make(entry(), {.batchEvents = batch});
    CapturedLog log;
    sendStop(*backend, Dictionary{{"Opt", "mine"}, {"n", 1}});
    sendStop(*backend, std::nullopt);
    backend->flushMessages();
    const auto posts = takeAll();
    const auto event = posts.at(0).event();
    EXPECT_EQ(event.at("Batch"), batch ? 1 : 0);
    EXPECT_EQ(event.at("Opt"), 0);
    EXPECT_EQ(event.at("n"), 1);
    EXPECT_FALSE(posts.back().events().back().as_object().contains("Batch"));
    const auto lines = linesOf(log);
    EXPECT_EQ(lines.at(0), adding);
    EXPECT_EQ(lines.at(2), adding);
    EXPECT_EQ(lines.at(3), "3 HTTPSPostBackend(sendMessage): SESSION_TYPE_STOP message dictionary is nil");
  }
}

TEST_F(HTTPSEvent, BodyLosesWhatJSONEventsCannotCarry) {
  // sent: null: the entry is removed
  const std::tuple<Value, boost::json::value, const char*> cases[] = {
      {Date{1.5}, 1.5, ""},
      {Date{-kInfinity}, -1.0, ""},
      {true, true, ""},
      {UINT64_MAX, UINT64_MAX, ""},
      {kInfinity, nullptr, "inf"},
      {Dictionary{{"a", 1}}, nullptr, "{\"a\": 1}"},
      {List{1}, nullptr, "[1]"},
      {Value(), nullptr, "null"},
      {Bytes("ab"), nullptr, "<2 bytes>"}};
  auto backend = make(entry());
  for (const auto& [value, expectedSent, shown] : cases) {
    CapturedLog log;
    send(*backend, Dictionary{{"it", value}});
    const auto event = take().event();
    const auto* sent = event.if_contains("it");
    EXPECT_EQ(sent ? *sent : nullptr, expectedSent);
    const auto lines = linesOf(log, "HTTPSPostBackend(createMessageForPostAndLogging): ");
    const std::string line = "4 TreeWriter unable to handle key: it, value: ";
    EXPECT_EQ(std::count(lines.begin(), lines.end(), line + shown), sent ? 0 : 1);
  }
}

Dictionary filter(const char* key, const char* action, const Value& method = -1, const Value& status = -1) {
  return Dictionary{{"key", key}, {"action", action}, {"method", method}, {"status", status}};
}

TEST_F(HTTPSEvent, FiltersDecideByTheFirstMatchingRecord) {
  const auto digest = [](const char* text) { return VeskReportingBackend::convertIntoSHA256(text); };
  EXPECT_EQ(digest("häß"), "75f46bf42d9409fca50bb527409a28d7eac1621c087755cd0136451e65631caf");
  const auto shield = [](const Value& method) { return Dictionary{{"key", "name"}, {"method", method}}; };
  // expected: nullopt: the key is removed
  const std::tuple<List, const char*, std::optional<std::string>> cases[] = {
      {{filter("NAME", "sha256")}, "name", digest("Ann")},
      {{filter("name", "sha256"), filter("name", "remove")}, "name", digest("Ann")},
      {{filter("naMe", "remove")}, "name", {}},
      {{shield(-1), filter("name", "remove")}, "name", "Ann"},
      {{filter("name", "remove", 3, 2)}, "name", {}},
      {{filter("name", "remove", " 3", 2.5)}, "name", {}},
      {{filter("name", "remove", 4)}, "name", "Ann"},
      {{filter("name", "remove", 3, 0)}, "name", "Ann"},
      {{filter("name", "remove", 0)}, "name", "Ann"},
      {{filter("name", "remove", -7, -7)}, "name", {}},
      {{Dictionary{{"action", "remove"}}}, "name", "Ann"},
      {{filter("nam", "remove")}, "name", "Ann"},
      {{filter("ken", "remove")}, "\u212Aen", {}},  // equal after case folding
      {{filter("\u212Aey", "remove")}, "key", {}},
      {{filter("clientname", "sha256")}, "clientName", digest("Camera")},
      {{filter("n", "sha256")}, "n", digest("42")},
      {{filter("date", "sha256")}, "date", digest("1700000000.5")},
      {{filter("never", "sha256")}, "never", digest("-1")},
      {{filter("nested", "sha256")}, "nested", {}},
      // Filters that can't be read hide the value rather than reveal it.
      {{filter("name", "remove", "x")}, "name", {}},
      {{filter("name", "sha256", 3, "2 or so")}, "name", digest("Ann")},
      {{filter("name", "sha256", 1e10, nullptr)}, "name", digest("Ann")},
      {{shield("3 or so"), filter("name", "remove")}, "name", {}}};
  for (const auto& [filters, key, expected] : cases) {
    CapturedLog log;
    send(*make(entry({{"filters", filters}})), Dictionary{{"name", "Ann"},
                                                          {"\u212Aen", "x"},
                                                          {"key", "x"},
                                                          {"n", 42},
                                                          {"date", Date{1'700'000'000.5}},
                                                          {"never", Date{kInfinity}},
                                                          {"nested", Dictionary{{"secret", 1}}}});
    const auto event = take().event();
    const auto* value = event.if_contains(key);
    const boost::json::value gone;
    EXPECT_EQ(value ? *value : gone, expected ? boost::json::value(*expected) : gone) << describe(filters);
    EXPECT_EQ(log.countContaining(4, "secret"), key == std::string("nested") ? 0 : 1);
  }
}

TEST_F(HTTPSEvent, UserInfoDecidesWhichMethodIsFiltered) {
  send(*make(entry({{"filters", List{filter("secret", "remove", 8, 9)}}}),
             {.userInfo = Dictionary{{"_method", "8"}, {"_status", 9}}}),
       Dictionary{{"secret", 1}});
  EXPECT_FALSE(take().event().contains("secret"));
}

TEST_F(HTTPSEvent, UnreadableFiltersAreToldOfOncePerStorebag) {
  const List filters{"remove",
                     filter("a", "hide", std::numeric_limits<double>::quiet_NaN()),
                     Dictionary{{"key", 7}, {"action", "remove"}},
                     filter("b", "sha256", "4294967296", List{1}),
                     filter("c", "remove", 2'147'483'647, -2'147'483'648.0),
                     Dictionary{{"key", "d"}, {"action", true}, {"status", ""}}};
  const auto warnings = [&](const List& list) {
    CapturedLog log;
    make(entry({{"filters", list}}))->updateState();
    auto lines = linesOf(log, "HTTPSPostBackend(createFiltersFromArray): httpPost: filter ");
    std::erase_if(lines, [](const std::string& line) { return line[0] != '4'; });
    return lines;
  };
  EXPECT_EQ(warnings(filters),
            (Lines{"4 0: not a dictionary: \"remove\"; the filter applies to nothing",
                   "4 1: 'action' is unknown: \"hide\"; the filter leaves values as they are",
                   "4 1: 'method' is not an integer of 32 bits: nan; the filter applies to nothing",
                   "4 2: 'key' is not a text: 7; the filter applies to nothing",
                   "4 3: 'method' is not an integer of 32 bits: \"4294967296\"; the filter applies to any",
                   "4 3: 'status' is not an integer of 32 bits: [1]; the filter applies to any",
                   "4 5: 'action' is unknown: true; the filter leaves values as they are",
                   "4 5: 'status' is not an integer of 32 bits: \"\"; the filter applies to nothing"}));
  EXPECT_EQ(warnings(filters), Lines{}) << "nor for another session";
  for (int i = 1; i < 260; ++i) EXPECT_EQ(warnings(List{i}).size(), 1u) << "another version of the storebag";
}

}  // namespace
}  // namespace vesk::test
