// Whether an event is posted at once or held, and how held events are posted.
#include "tests/support/HTTPSBackendTest.h"
#include "tests/support/TestRoot.h"

namespace vesk::test {
namespace {

constexpr const char* kSendMessage = "HTTPSPostBackend(sendMessage): ";

using HTTPSBatch = HTTPSBackendTest;

TEST_F(HTTPSBatch, FlagsStateAndBatchingChooseTheRoad) {
  // postedTo: "" for held or dropped
  // line: "" for none
  const std::tuple<std::int32_t, bool, std::int32_t, const char*, std::int32_t, const char*, bool> cases[] = {
      {2, false, 0, "/post", 2, "7 Sending 2, 0, 1", false},
      {2, true, 0, "", 2, "7 Batching 2, 1, 1", false},
      {2, true, 1, "/realtime", 2, "7 Sending 2, 1, 1", false},
      {2, false, 2, "/post", 2, "7 Sending 2, 0, 1", false},
      {0, false, 0, "", 0, "7 Batching 0, 0, 1", false},
      {0, false, 1, "/realtime", 0, "7 Sending 0, 0, 1", false},
      {0, false, 2, "", 0, "7 Batching 0, 0, 1", false},
      {0, false, 3, "/realtime", 0, "7 Sending 0, 0, 1", false},
      {3, false, 0, "", 3, "7 Batching 3, 0, 1", false},
      {3, false, 1, "/realtime", 3, "7 Sending 3, 0, 1", false},
      {3, false, 2, "/post", 2, "7 Sending 2, 0, 1", false},
      {3, true, 2, "", 2, "7 Batching 2, 1, 1", false},
      {3, true, 3, "/realtime", 2, "7 Sending 2, 1, 1", false},
      {3, false, 7, "", 3, "7 Batching 3, 0, 1", false},
      {1, false, 1, "", 1, "", false},
      {1, false, 2, "", 1, "", false},
      {2, false, 0, "", 2, "7 Batching 2, 0, 1", true},
      {2, false, 1, "/realtime", 2, "7 Sending 2, 0, 1", true}};
  for (const auto& [state, batch, flag, postedTo, stateAfter, line, lacksUserInfo] : cases) {
    SCOPED_TRACE(testing::Message() << "state " << state << " flag " << flag);
    auto backend = make(entry(), {.batchEvents = batch});
    if (lacksUserInfo) backend->setUserInfoDict(std::nullopt);
    backend->setState(state);
    CapturedLog log;
    send(*backend, Dictionary(), 3, flag);
    EXPECT_EQ(linesOf(log, kSendMessage), *line ? Lines{line} : Lines{});
    EXPECT_EQ(takeTargets(), *postedTo ? Lines{std::string(postedTo) + " 1"} : Lines{});
    EXPECT_EQ(backend->state(), stateAfter);
  }
}

TEST_F(HTTPSBatch, HeldEventsGoFirstOnceEnabled) {
  const std::string forced =
      "7 Backend has changed its state to 'Enabled', batching is not requested and some events have already "
      "been batched. Forcing Flush here to keep events in order.";
  const std::tuple<std::int32_t, bool, Lines> cases[] = {
      {2, false, {forced, "7 HTTPSPostBackend(flushMessages): called", "7 Sending 2, 0, 1"}},
      {2, true, {"7 Sending 2, 1, 1"}},
      {0, false, {"7 Sending 0, 0, 1"}}};
  for (const auto& [state, batch, lines] : cases) {
    auto backend = make(List{entry({{"client", "Camera"}}), entry({{"expedite", batch ? 0 : 1}})},
                        {.batchEvents = true});
    send(*backend);
    update(*backend, userNamed("Other"));
    backend->setState(state);
    CapturedLog log;
    send(*backend, Dictionary(), 3, MessageFlagRealtime);
    EXPECT_EQ(takeAll().size(), lines.size() > 1 ? 2u : 1u);
    EXPECT_EQ(linesOf(log, kSendMessage), lines);
  }
}

TEST_F(HTTPSBatch, FlushNeedsEventsAnEnabledBackendAndItsUserInfo) {
  for (const bool requireUserInfo : {true, false}) {
    auto backend = make(entry(), {.requireUserInfo = requireUserInfo, .batchEvents = true});
    EXPECT_FALSE(backend->flushMessages()) << "nothing is held";
    send(*backend);
    for (int state : {0, 1, 3}) {
      backend->setState(state);
      EXPECT_FALSE(backend->flushMessages()) << state;
    }
    backend->setState(BackendStateEnabled);
    backend->setUserInfoDict(std::nullopt);
    EXPECT_EQ(backend->flushMessages().has_value(), !requireUserInfo);
    backend->setUserInfoDict(userNamed("Camera"));
    EXPECT_EQ(backend->flushMessages().has_value(), requireUserInfo) << "or it is flushed already";
    EXPECT_EQ(takeTargets(), Lines{"/post 1"});
  }
}

TEST_F(HTTPSBatch, FiftyEventsOfAMethodAreHeldByDefault) {
  CapturedLog log;
  auto backend = make(entry(), {.batchEvents = true});
  for (int i = 0; i < 51; ++i) send(*backend, Dictionary(), i == 0 ? 9 : 3);
  EXPECT_EQ(takeTargets(), Lines{});
  send(*backend);
  EXPECT_EQ(takeTargets(), Lines{"/post 51"});
  EXPECT_EQ(log.count(7,
                      "HTTPSPostBackend(batchEvent): Flushing all batched events as we reached event "
                      "threshold for method 3"),
            1);
}

TEST_F(HTTPSBatch, CountsStartAgainAfterFlushes) {
  auto backend = make(entry({{"event_threshold", 1}, {"expedite", 0}}));
  const auto sendAll = [&](std::initializer_list<int> methods) {
    for (int method : methods) send(*backend, Dictionary(), method);
    return takeTargets();
  };
  EXPECT_EQ(sendAll({3, 9, 9, 3}), Lines{});
  EXPECT_EQ(sendAll({3}), Lines{"/post 4"});
  EXPECT_EQ(sendAll({9, 9}), Lines{}) << "the other method's count is gone too";
  EXPECT_EQ(sendAll({9}), Lines{"/post 3"});
  backend->setState(BackendStatePending);
  EXPECT_EQ(sendAll({9, 9}), Lines{}) << "a flush in vain";
  backend->setState(BackendStateEnabled);
  EXPECT_EQ(sendAll({9}), Lines{}) << "from which the count restarted";
  EXPECT_EQ(sendAll({9}), Lines{"/post 4"});
}

TEST_F(HTTPSBatch, LateUserInfoReachesTheEventsThatLackItFiltered) {
  auto backend = make(
      entry({{"filters", List{Dictionary{{"key", "serviceName"}, {"action", "remove"}}}}, {"expedite", 0}}),
      {.userInfo = std::nullopt});
  send(*backend, Dictionary{{"extra", "event"}, {"serviceName", "event"}});
  send(*backend, Dictionary{{"extra", "event"}, {"clientName", "event"}});
  update(*backend, Dictionary{{"serviceName", "user"}, {"clientName", "user"}, {"extra", "user"}});
  send(*backend);
  const auto printable = backend->flushMessages().value();
  const auto post = take();
  EXPECT_TRUE(printable.starts_with("{\n    \"postTime\": 1700000000.0,\n")) << printable;
  EXPECT_EQ(boost::json::parse(printable), boost::json::value(post.body));
  const std::tuple<const char*, const char*, bool> expected[] = {
      {"user", "user", true}, {"event", "event", false}, {"user", "user", false}};
  for (std::size_t i = 0; const auto& [clientName, extra, hasService] : expected) {
    const auto event = post.event(i++);
    EXPECT_EQ(event.at("clientName"), clientName);
    EXPECT_EQ(event.at("extra"), extra);
    EXPECT_EQ(event.contains("serviceName"), hasService);
  }
  update(*backend, Dictionary{{"serviceName", "user"}});
  send(*backend);
  EXPECT_TRUE(backend->flushMessages()) << "also where the filters leave nothing of the user info";
}

TEST_F(HTTPSBatch, CorrelationReachesHeldAndLaterEvents) {
  auto backend = make(entry({{"expedite", 0}}));
  for (const char* sessionID : {"family", ""}) {
    for (int i = 0; i < 2; ++i) send(*backend);
    backend->setCorrelatedSessionID(*sessionID ? std::optional<std::string>(sessionID) : std::nullopt);
    EXPECT_EQ(backend->combinedSessionIDString().value_or(""), sessionID);
    send(*backend);
    backend->flushMessages();
    for (const auto& event : take().events()) {
      const auto* sent = event.as_object().if_contains("_sessionID");
      EXPECT_EQ(sent ? sent->as_string() : "", sessionID);
    }
  }
}

// --- Bounds

const std::string kMebibyte(std::size_t{1} << 20, 'x');

TEST_F(HTTPSBatch, HeldEventsAreBoundedByDroppingTheOldest) {
  CapturedLog log;
  auto backend = make(entry());
  backend->setState(BackendStatePending);
  for (int i = 0; i < 40; ++i) send(*backend, Dictionary{{"n", i}, {"bulk", kMebibyte}}, i);
  EXPECT_EQ(
      log.count(4,
                "HTTPSPostBackend(batchEvent): backend httpPost holds more than 16777216 bytes: dropping "
                "its oldest events"),
      1);
  const std::uint64_t dropped = harness.dropped(DropReason::OverBound);
  EXPECT_EQ(dropped, 27u) << "an eighth at a time";
  backend->updateState();
  backend->flushMessages();
  const auto post = take();
  EXPECT_EQ(post.events().size(), 40 - dropped);
  EXPECT_EQ(post.event(post.events().size() - 1).at("n"), 39) << "the newest stay";
}

}  // namespace
}  // namespace vesk::test
