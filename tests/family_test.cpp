// Families of sessions: parents, combined IDs, reporting states, aggregation.
#include <gtest/gtest.h>

#include <atomic>
#include <future>
#include <latch>
#include <limits>

#include "tests/support/CapturedLog.h"
#include "tests/support/FamilyHarness.h"

namespace vesk::test {
namespace {

using Family = FamilyHarness;

TEST_F(Family, ChildrenCarryTheirAncestorsAndCopyTheirStates) {
  CapturedLog log;
  auto top = join(0);
  auto child = join(1);
  EXPECT_EQ(names, BackendNames{"httpPost"}) << "sampled out by itself, enabled by its parent";
  auto grandchild = join(2, false, "MYAPP");
  grandchild.send(message());
  EXPECT_EQ(lastSessionID(),
            top->sessionIDString() + "." + child->sessionIDString() + "." + grandchild->sessionIDString());
  EXPECT_EQ(harness.agent->parentSessionIDStringForSession(*top.session), std::nullopt);
  RecursiveMutexLock lock(harness.agent->monitor());
  EXPECT_EQ(harness.agent->parentSessionForChild(*grandchild.session), child.session);
  EXPECT_EQ(child->samplingThresholdWithBackendName("httpPost"), Value(1.0));
}

TEST_F(Family, AMissingParentLeavesAGap) {
  CapturedLog log;
  auto top = join(0);
  auto grandchild = join(2);
  EXPECT_EQ(names, BackendNames{});
  EXPECT_EQ(harness.agent->parentSessionIDStringForSession(*grandchild.session), std::nullopt);
  for (const char* line :
       {"parentSessionIDStringForSession: Found a gap in hierarchy (one of parents missing): incomplete "
        "parentSessionID is ''",
        "parentSessionForChild: Unable to find session with hierarchy of 1 for userInfoKey 'myapp:calls'",
        "syncReportingStates: child session 102 (backend httpPost) is missing its parent"})
    EXPECT_GE(log.count(6, line), 1) << line;
}

TEST_F(Family, LongNamesFillNoLog) {
  CapturedLog log;
  const std::string name(1 << 20, 'x');
  auto child = join(1, false, name.c_str());  // without a parent
  child->setSessionInfo(sessionInfo(1), userInfo((name + "y").c_str()), {}, false);
  auto ask = [&] {
    harness.agent->parentSessionIDStringForSession(*child.session);
    RecursiveMutexLock lock(harness.agent->monitor());
    harness.agent->parentSessionForChild(*child.session);
  };
  ask();  // nobody is there under that name
  auto sibling = join(1, false, (name + "y").c_str());
  ask();  // somebody is, but not this one
  EXPECT_EQ(log.countContaining(3, " for user info key xxx"), 4);
  for (const auto& [level, line] : log.lines()) EXPECT_LT(line.size(), 1024u);
}

TEST_F(Family, TheHighestAggregatorGetsTheMessages) {
  auto child = join(1, true);
  auto top = join(0, true);
  EXPECT_FALSE(child->hasAggregator()) << "shut down by the arrival above it";
  ASSERT_EQ(child.connection->calls.size(), 2u) << "its own start message and the closing one";
  EXPECT_FALSE(std::get<std::optional<Dictionary>>(child.connection->calls.back().arguments.at(0)));
  auto grandchild = join(2);
  grandchild.send(message());
  ASSERT_FALSE(top.connection->calls.empty());
  const auto& call = top.connection->calls.back();
  EXPECT_STREQ(call.member, "sendMessageToClient");
  auto info = std::get<std::optional<Dictionary>>(call.arguments.at(0));
  EXPECT_EQ(info->find(kVeskReportingSessionInfoSessionID)->asInteger(), 102);
  EXPECT_EQ(std::get<std::uint16_t>(call.arguments.at(2)), 3);
  EXPECT_EQ(child.connection->calls.size(), 2u);
}

TEST_F(Family, LevelsMayBeAnyNumber) {
  auto top = join(0, true);
  harness.storebags[8] = Dictionary{{"httpPost", profile(std::numeric_limits<std::int32_t>::max(), 1.0)}};
  harness.storebags[9] = Dictionary{{"httpPost", profile(std::numeric_limits<std::int32_t>::min(), 1.0)}};
  join(3).send(message());
  ASSERT_FALSE(top.connection->calls.empty());
  const std::size_t before = top.connection->calls.size();
  CapturedLog log;
  join(4).send(message());
  EXPECT_EQ(top.connection->calls.size(), before);
  EXPECT_EQ(log.countContaining(6, "Found a gap"), 0) << "nothing is above it";
}

TEST_F(Family, ASessionLeavesItsFamilyUnderWhateverNameItJoined) {
  std::weak_ptr<ReportingdSession> tookItBack;
  std::weak_ptr<ReportingdSession> configuredAnew;
  {
    auto first = join(0, true);
    auto child = join(1);
    first->fetchStatesWithUserInfo(std::nullopt, {});
    const std::size_t before = first.connection->calls.size();
    child.send(message());
    EXPECT_EQ(first.connection->calls.size(), before) << "its family's messages are no longer its business";
    tookItBack = first.session;
    auto second = join(0);
    second->setSessionInfo(Dictionary(), userInfo("Other"), {}, false);
    configuredAnew = second.session;
  }
  EXPECT_TRUE(tookItBack.expired());
  EXPECT_TRUE(configuredAnew.expired());
}

TEST_F(Family, NobodyTakesASessionThatStartsForItsParent) {
  harness.storebags[6] =
      Dictionary{{"httpPost", Dictionary{{"clients", List{Dictionary{{"hierarchy", 1},
                                                                     {"expedite", 1},
                                                                     {"locale_whitelist", List{"US"}},
                                                                     {"filters", List{Dictionary()}},
                                                                     {"sampling_threshold", 1.0}}}}}}};
  auto sibling = join(1);
  auto starting = harness.newSession();
  starting->setSessionInfo(sessionInfo(1), userInfo("MyApp"), {}, false);
  std::future<void> refresh;
  std::atomic_flag isAsked;  // the sibling's thread logs as well
  SystemLog::setLevel(7);
  SystemLog::setSink([&](LogLevel, std::string_view line) {
    // It is in its family now, and its level is not decided yet.
    if (line.find("Store bag override") == std::string_view::npos || isAsked.test_and_set()) return;
    refresh =
        std::async(std::launch::async, [&] { sibling->fetchStatesWithUserInfo(userInfo("MYAPP"), {}); });
    refresh.wait_for(std::chrono::milliseconds(100));  // it goes on, or waits for this thread
  });
  starting.start();
  refresh.get();
  SystemLog::setSink(nullptr);
  SystemLog::setLevel(6);
  EXPECT_EQ(sibling->fetchReportingStates(), BackendNames{"httpPost"});
}

TEST_F(Family, AcceptingWaitsForNoStorebag) {
  CapturedLog log;
  auto top = join(0);
  std::latch held(1), accepted(1);
  auto fetch = std::async(std::launch::async, [&] {
    RecursiveMutexLock lock(harness.agent->monitor());
    held.count_down();
    accepted.wait();
  });
  held.wait();
  auto connection = std::make_shared<RecordingConnection>();
  EXPECT_TRUE(harness.agent->shouldAcceptNewConnection(connection));
  EXPECT_EQ(log.countContaining(7, "Accepting new Orvo connection recording connection, 0(1) connections."),
            1);
  accepted.count_down();
  connection->invalidate();
}

TEST_F(Family, ClientsThatLeaveLoseNothing) {
  { auto neverStarted = harness.newSession(); }
  {
    auto aggregator = join(0, true);
    aggregator.connection->clientIsGone = true;
  }
  EXPECT_EQ(harness.dropped(DropReason::NoBackend) + harness.dropped(DropReason::NotAggregated), 0u);
}

}  // namespace
}  // namespace vesk::test
