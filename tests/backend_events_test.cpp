// What an HTTPS backend makes of messages: event records, filters, batches, posts.
#include <gtest/gtest.h>

#include "tests/support/BackendHarness.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/TestRoot.h"

namespace vesk::test {
namespace {

timeval at(double seconds) {
  return timevalFrom(WallTime(std::chrono::microseconds(static_cast<std::int64_t>(seconds * 1e6))));
}

constexpr double kStart = 1'000'000'019.7;

class BackendEvents : public ::testing::Test {
 protected:
  /// A backend whose one client entry is `entry` over a post URL and the things that reporting needs.
  std::shared_ptr<VeskReportingBackend> make(Dictionary entry = {}) {
    MutableDictionary whole(Dictionary{{"post_url", harness.url()},
                                       {"realtime_post_url", harness.url("/realtime")},
                                       {"locale_whitelist", List{"US"}},
                                       {"filters", List{Dictionary{{"key", "unused"}}}},
                                       {"sampling_threshold", 1.0}});
    whole.setAll(entry);
    auto backend = VeskReportingBackend::newBackendWithName(kVeskReportingBackendHTTPPost,
                                                            Dictionary{{"clients", List{whole.share()}}},
                                                            Text("Phone"), 5, harness.services);
    backend->setCompType(5);
    backend->setClientVersion(3);
    backend->setHardwareType(Text("Phone7,2"));
    backend->setProductVersion(Text("12.1"));
    backend->setSelfVersion("7.2.9");
    backend->setStartTimestamp(at(kStart));
    backend->setCombinedSessionIDString("session-text");
    backend->setUdid("0123456789");
    backend->updateState();
    return backend;
  }
  /// The same, told to wait for user info; it has it already when `known` is given.
  std::shared_ptr<VeskReportingBackend> makeRequiringUserInfo(Dictionary entry,
                                                              std::optional<Dictionary> known) {
    auto backend = make(std::move(entry));
    backend->setRequireUserInfo(true);
    backend->setUserInfoDict(known);
    backend->updateState();
    return backend;
  }
  void send(VeskReportingBackend& backend, Dictionary payload, std::uint16_t method = 3,
            std::int32_t flag = 0) {
    backend.sendMessage(payload, at(kStart + 5.25), method, 2, flag);
  }

  BackendHarness harness;
  const Dictionary userInfo{{kVeskReportingUserInfoClientName, "Camera"},
                            {kVeskReportingUserInfoServiceName, "Clips"}};
};

TEST_F(BackendEvents, RecordCarriesPayloadAndComputedFields) {
  auto backend = make();
  send(*backend, Dictionary{{"text", "häß"}, {"n", -7}, {"x", 2.5}, {"_method", "mine"}, {"eventTime", 0}});
  auto posts = harness.posts();
  ASSERT_EQ(posts.size(), 1u);
  auto event = posts[0].event();
  // "_internal": no environment type is set, which means seed.
  const auto expected = boost::json::parse(R"({
    "text": "häß", "n": -7, "x": 2.5, "_startTS": 999999960, "_sender": "HD", "_clientVersion": 3,
    "_sessionID": "session-text", "_eventNumber": 1, "_method": 3, "_status": 2, "_productFamily": "Phone",
    "_productModel": "Phone7,2", "_osVersion": "12.1", "_reportVers": "7.2", "_internal": 2})");
  for (const auto& [key, value] : expected.as_object()) EXPECT_EQ(event.at(key), value) << key;
  for (const char* key : {"_clientTS", "eventTime"})
    EXPECT_DOUBLE_EQ(event.at(key).as_double(), 999'999'965.25);
  EXPECT_FALSE(event.contains("_build")) << "a fact that is not known is left out";
  EXPECT_TRUE(event.contains("_timezoneOffset"));

  const auto& request = posts[0].request;
  EXPECT_EQ(request.header("X-Vesk-Sender"), "HD");
  EXPECT_EQ(request.header("X-Vesk-Event-Map"), "3 2");
  EXPECT_EQ(request.header("Accept"), "application/json");
  EXPECT_EQ(request.header("Content-Type"), "application/json");
  EXPECT_FALSE(request.header("X-Vesk-Client-Name"));
  EXPECT_EQ(posts[0].body.at("clientId"), "id-respecting");
  EXPECT_DOUBLE_EQ(posts[0].body.at("postTime").as_double(), 1'700'000'000);
}

TEST_F(BackendEvents, EventNumbersWrap) {
  auto backend = make();
  backend->setState(BackendStateDisabled);
  for (int i = 0; i < 65534; ++i) backend->sendMessage(std::nullopt, at(kStart), 1, 0, 0);
  backend->updateState();
  for (int i = 0; i < 3; ++i) send(*backend, {});
  std::vector<std::int64_t> numbers;
  for (const auto& post : harness.posts()) numbers.push_back(post.event().at("_eventNumber").as_int64());
  std::sort(numbers.begin(), numbers.end());
  EXPECT_EQ(numbers, (std::vector<std::int64_t>{0, 1, 65535}));
  EXPECT_EQ(harness.dropped(DropReason::StateDisabled), 65534u);
}

TEST_F(BackendEvents, BodyLosesWhatJSONEventsCannotCarry) {
  CapturedLog log;
  auto backend = make();
  send(*backend, Dictionary{{"when", Date{1.5}},
                            {"never", Date{std::numeric_limits<double>::infinity()}},
                            {"notANumber", std::numeric_limits<double>::quiet_NaN()},
                            {"nested", Dictionary{{"a", 1}}},
                            {"list", List{1}},
                            {"nothing", Value()},
                            {"raw", Bytes("ab")},
                            {"flag", true}});
  auto event = harness.posts().at(0).event();
  EXPECT_EQ(event.at("when"), 1.5);
  EXPECT_EQ(event.at("never"), -1.0);
  EXPECT_EQ(event.at("flag"), true);
  for (const char* gone : {"nested", "list", "nothing", "raw", "notANumber"})
    EXPECT_FALSE(event.contains(gone)) << gone;
  EXPECT_EQ(
      log.count(4,
                "HTTPSPostBackend(createMessageForPostAndLogging): TreeWriter unable to handle key: nested, "
                "value: {\"a\": 1}"),
      1);
  EXPECT_EQ(log.countContaining(4, "TreeWriter unable to handle key"), 5);
}

TEST_F(BackendEvents, StopMessageTellsHowItWasSampled) {
  auto backend =
      makeRequiringUserInfo(Dictionary{{"sampling_threshold", 0.5}, {"override_sampling", 0.75}}, userInfo);
  backend->setState(BackendStateEnabled);
  backend->sendMessage(Dictionary{{"StorebagVersion", "1"}}, at(kStart), 0, 1, 0);
  auto plain = make();
  plain->sendMessage(Dictionary(), at(kStart), 0, 1, 0);
  auto posts = harness.posts();
  ASSERT_EQ(posts.size(), 2u);
  for (const auto& post : posts) {
    auto event = post.event();
    bool sampled = event.contains("StorebagVersion");
    EXPECT_EQ(event.at("Opt"), 0);
    EXPECT_EQ(event.at("SamplingThreshold"), sampled ? boost::json::value(0.5) : boost::json::value(-1));
    EXPECT_EQ(event.at("OverrideSampling"), boost::json::value(-1))
        << "not reached while the draw is under 0.5";
    EXPECT_EQ(event.at("Batch"), 0);
  }
}

struct FilterCase {
  const char* name;
  List filters;
  const char* key;
  std::optional<std::string> expected;  // nothing: the key is gone
};

TEST_F(BackendEvents, FiltersDecideByTheFirstMatchingRecord) {
  const std::string digest = VeskReportingBackend::convertIntoSHA256("Ann");
  auto filter = [](const char* key, const char* action, int method = -1, int status = -1) {
    return Dictionary{{"key", key}, {"action", action}, {"method", method}, {"status", status}};
  };
  const FilterCase cases[] = {
      {"digest, any case", {filter("USERNAME", "sha256")}, "username", digest},
      {"first wins", {filter("username", "sha256"), filter("username", "remove")}, "username", digest},
      {"remove", {filter("userName", "remove")}, "username", std::nullopt},
      {"leave shields", {filter("username", "keep"), filter("username", "remove")}, "username", "Ann"},
      {"method matches", {filter("username", "remove", 3)}, "username", std::nullopt},
      {"other method", {filter("username", "remove", 4)}, "username", "Ann"},
      {"status matches", {filter("username", "remove", -1, 2)}, "username", std::nullopt},
      {"other status", {filter("username", "remove", -1, 9)}, "username", "Ann"},
      {"no key", {Dictionary{{"action", "remove"}}}, "username", "Ann"},
      {"not a dictionary", {Value("remove"), filter("username", "remove")}, "username", std::nullopt},
      {"longer key", {filter("user", "remove")}, "username", "Ann"},
      {"folded beyond ASCII", {filter("ken", "remove")}, "\u212Aen", std::nullopt},
      {"user info too",
       {filter("clientname", "sha256")},
       "clientName",
       VeskReportingBackend::convertIntoSHA256("Camera")},
      {"numbers as decimal text",
       {filter("n", "sha256")},
       "n",
       VeskReportingBackend::convertIntoSHA256("42")},
      {"no digest of a dictionary", {filter("d", "sha256")}, "d", std::nullopt},
  };
  for (const auto& test : cases) {
    SCOPED_TRACE(test.name);
    auto backend = makeRequiringUserInfo(Dictionary{{"filters", test.filters}}, userInfo);
    send(*backend,
         Dictionary{{"username", "Ann"}, {"\u212Aen", "x"}, {"n", 42}, {"d", Dictionary{{"secret", 1}}}});
    auto event = harness.posts().back().event();
    EXPECT_EQ(event.contains(test.key), test.expected.has_value());
    if (test.expected && event.contains(test.key)) {
      EXPECT_EQ(event.at(test.key).as_string(), *test.expected);
    }
  }
}

struct RoadCase {
  const char* name;
  std::int32_t state;
  bool batch;
  std::int32_t flag;
  std::optional<const char*> postedTo;  // nothing: held
  std::int32_t stateAfter;
};

TEST_F(BackendEvents, FlagsStateAndBatchingChooseTheRoad) {
  const RoadCase cases[] = {
      {"enabled", 2, false, 0, "/post", 2},
      {"enabled, batching", 2, true, 0, std::nullopt, 2},
      {"realtime beats batching", 2, true, 1, "/realtime", 2},
      {"pending holds", 0, false, 0, std::nullopt, 0},
      {"realtime while pending", 0, false, 1, "/realtime", 0},
      {"override band holds", 3, false, 0, std::nullopt, 3},
      {"override flag lifts and posts", 3, false, 2, "/post", 2},
      {"override flag lifts, batching holds", 3, true, 2, std::nullopt, 2},
      {"both flags", 3, true, 3, "/realtime", 2},
      {"unknown flag acts as 0", 3, false, 4, std::nullopt, 3},
      {"disabled drops", 1, false, 1, std::nullopt, 1},
  };
  for (const auto& test : cases) {
    SCOPED_TRACE(test.name);
    auto backend = make();
    backend->setBatchEvents(test.batch);
    backend->setState(test.state);
    std::size_t before = harness.posts().size();
    send(*backend, Dictionary{{"a", 1}}, 3, test.flag);
    auto posts = harness.posts();
    EXPECT_EQ(posts.size() - before, test.postedTo ? 1u : 0u);
    if (test.postedTo && posts.size() > before) {
      EXPECT_EQ(posts.back().request.target, *test.postedTo);
    }
    EXPECT_EQ(backend->state(), test.stateAfter);
  }
}

TEST_F(BackendEvents, HeldEventsGoFirstOnceEnabled) {
  auto backend = make();
  backend->setState(BackendStatePending);
  send(*backend, Dictionary{{"n", 1}});
  backend->setState(BackendStateEnabled);
  send(*backend, Dictionary{{"n", 2}});
  auto posts = harness.posts();
  ASSERT_EQ(posts.size(), 2u);
  EXPECT_FALSE(posts[0].request.header("X-Vesk-Event-Map") && posts[1].request.header("X-Vesk-Event-Map"))
      << "a flush has no event map";
}

TEST_F(BackendEvents, ThresholdFlushesTheWholeBatch) {
  auto backend = make();
  backend->setBatchEvents(true);
  send(*backend, Dictionary{{"other", 1}}, 9);
  for (int i = 0; i < 50; ++i) send(*backend, Dictionary{{"n", i}});
  EXPECT_TRUE(harness.posts().empty());
  send(*backend, Dictionary{{"n", 50}});
  auto posts = harness.posts();
  ASSERT_EQ(posts.size(), 1u);
  EXPECT_EQ(posts[0].events().size(), 51u);
  EXPECT_EQ(posts[0].request.header("Content-Encoding"), "gzip");
  EXPECT_EQ(posts[0].request.header("Content-Length"), std::to_string(posts[0].request.body.size()));
  EXPECT_FALSE(posts[0].request.header("X-Vesk-Event-Map"));
  auto printable = backend->flushMessages();
  ASSERT_TRUE(printable);
  EXPECT_NE(printable->find("\"n\": 50"), std::string::npos);
  EXPECT_FALSE(backend->flushMessages()) << "nothing is left";
}

TEST_F(BackendEvents, EventsHeldBeforeTheUserInfoGetItFiltered) {
  auto backend = makeRequiringUserInfo(
      Dictionary{{"filters", List{Dictionary{{"key", "serviceName"}, {"action", "remove"}}}},
                 {"expedite", 0}},
      std::nullopt);
  EXPECT_EQ(backend->state(), BackendStatePending);
  send(*backend, Dictionary{{"n", 1}});
  EXPECT_FALSE(backend->flushMessages());
  backend->setUserInfoDict(Dictionary{{kVeskReportingUserInfoClientName, "Cam\r\nX-Evil: 1"},
                                      {kVeskReportingUserInfoServiceName, "Clips"}});
  backend->updateState();
  send(*backend, Dictionary{{"n", 2}});
  backend->flushMessages();
  auto posts = harness.posts();
  ASSERT_EQ(posts.size(), 1u);
  for (std::size_t i = 0; i < 2; ++i) {
    EXPECT_EQ(posts[0].event(i).at("clientName"), "Cam\r\nX-Evil: 1");
    EXPECT_FALSE(posts[0].event(i).contains("serviceName"));
  }
  EXPECT_EQ(posts[0].request.header("X-Vesk-Client-Name"), "CamX-Evil: 1");
  EXPECT_EQ(posts[0].request.header("X-Vesk-Service-Name"), "Clips");
  EXPECT_FALSE(posts[0].request.header("X-Evil"));
}

TEST_F(BackendEvents, LargeUserInfoThatComesLateGoesWithTheNewestEvents) {
  auto backend = makeRequiringUserInfo(Dictionary{{"expedite", 0}}, std::nullopt);
  for (int i = 0; i < 100; ++i) send(*backend, Dictionary{{"n", i}}, static_cast<std::uint16_t>(i));
  MutableDictionary large(userInfo);
  large.set("bulk", std::string(std::size_t{1} << 20, 'x'));
  for (int i = 0; i < 40; ++i) large.set(std::to_string(i), i);
  large.set("n", "of the user");
  backend->setUserInfoDict(large.share());
  backend->updateState();
  backend->flushMessages();
  auto post = harness.posts().at(0);
  const std::size_t sent = post.events().size();
  EXPECT_EQ(sent, 31u) << "twice what may be held";
  EXPECT_EQ(sent + harness.dropped(DropReason::OverBound), 100u);
  EXPECT_EQ(post.event(sent - 1).at("_method"), 99);
  EXPECT_EQ(post.event(sent - 1).at("n"), "of the user");
  EXPECT_EQ(post.event(sent - 1).at("39"), 39);
}

TEST_F(BackendEvents, ServerAnswersDecideTheState) {
  CapturedLog log;
  // The status decides, also when the rest of the answer does not arrive.
  for (auto fault : {HTTPAnswer::Fault::None, HTTPAnswer::Fault::CloseMidAnswer}) {
    for (unsigned status : {200u, 302u, 404u, 500u, 599u, 503u}) {
      SCOPED_TRACE(status);
      harness.answerWith(status, fault);
      auto backend = make();
      send(*backend, {});
      harness.posts();
      EXPECT_EQ(backend->state(), status < 500 ? 2 : 1);
    }
  }
  EXPECT_EQ(log.count(6, "postJSONMessage: backend httpPost disabled by server 503 return code"), 2);
  EXPECT_EQ(log.countContaining(3, "HTTPSPostBackend(postJsonMessage): post error: "), 6);
  EXPECT_EQ(harness.dropped(DropReason::ServerError5xx), 6u);
  EXPECT_EQ(harness.dropped(DropReason::ServerRefused), 4u);
  EXPECT_EQ(harness.dropped(DropReason::TransportError), 0u);
}

TEST_F(BackendEvents, WhatHasNowhereToGoIsCounted) {
  auto backend = VeskReportingBackend::newBackendWithName(kVeskReportingBackendHTTPPost2,
                                                          Dictionary{{"clients", List{Dictionary()}}},
                                                          Text("Phone"), 99, harness.services);
  backend->updateState();
  send(*backend, {}, 3, 1);
  auto elsewhere = make(Dictionary{{"post_url", "ftp://host/"}, {"expedite", 0}});
  for (int i = 0; i < 3; ++i) send(*elsewhere, {});
  elsewhere->flushMessages();
  EXPECT_TRUE(harness.posts().empty());
  EXPECT_EQ(harness.dropped(DropReason::NoURL), 1u);
  EXPECT_EQ(harness.dropped(DropReason::TransportError), 3u) << "each event of the batch";
}

TEST_F(BackendEvents, OneBackendAtTheBoundLeavesTheOthersTheirBatches) {
  auto account = HeldBudget().accountFor(1000);
  auto holds = make();
  holds->setState(BackendStateOverride);
  auto batches = make();
  batches->setBatchEvents(true);
  for (auto& backend : {holds, batches}) backend->setHeldBytes(account);
  const std::string bulk(std::size_t{1} << 20, 'x');
  for (int i = 0; i < 40; ++i) {
    send(*holds, Dictionary{{"bulk", bulk}});
    send(*batches, {}, static_cast<std::uint16_t>(i));
  }
  EXPECT_LT(harness.posts().size(), 15u);
}

TEST_F(BackendEvents, HeldEventsAreBoundedByDroppingTheOldest) {
  CapturedLog log;
  auto backend = make();
  backend->setState(BackendStatePending);
  const std::string mebibyte(std::size_t{1} << 20, 'x');
  for (int i = 0; i < 40; ++i)
    send(*backend, Dictionary{{"n", i}, {"bulk", mebibyte}}, static_cast<std::uint16_t>(i));
  EXPECT_EQ(log.countContaining(4, "dropping its oldest events"), 1);
  std::uint64_t dropped = harness.dropped(DropReason::OverBound);
  EXPECT_GE(dropped, 24u);
  EXPECT_LT(dropped, 30u);
  backend->updateState();
  backend->flushMessages();
  auto post = harness.posts().at(0);
  EXPECT_EQ(post.events().size(), 40 - dropped);
  EXPECT_EQ(post.event(post.events().size() - 1).at("n"), 39) << "the newest stay";
}

}  // namespace
}  // namespace vesk::test
