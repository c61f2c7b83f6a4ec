// Families while their members come, move and go: the order in which things must happen.
#include <gtest/gtest.h>

#include <future>
#include "tests/support/CapturedLog.h"
#include "tests/support/FamilyHarness.h"

namespace vesk::test {
namespace {

class FamilyLife : public FamilyHarness {
 protected:
  static std::optional<Dictionary> infoOf(const IPCOutgoingCall& call) {
    return std::get<std::optional<Dictionary>>(call.arguments.at(0));
  }
  /// True when another thread can take the agent's monitor now.
  bool monitorIsFree() {
    auto taken = std::make_shared<std::promise<void>>();
    std::thread([taken, agent = harness.agent] {
      RecursiveMutexLock lock(agent->monitor());
      taken->set_value();
    }).detach();
    return taken->get_future().wait_for(std::chrono::seconds(10)) == std::future_status::ready;
  }
};

TEST_F(FamilyLife, AnAncestorThatEndsWhileAChildSendsIsDestroyedByTheChildOutsideTheMonitor) {
  CapturedLog log;
  auto top = join(0, true);
  auto child = join(1);
  auto connection = top.connection;
  std::weak_ptr<ReportingdSession> watched = top.session;
  std::optional<bool> freeAtTheEnd;
  connection->onCall = [&](const IPCOutgoingCall& call) {
    if (!infoOf(call)) {
      freeAtTheEnd = monitorIsFree();  // the closing message: this is the session's destruction
    } else if (top.session) {
      harness.agent->sessionInvalidated(top.session);  // its connection ends in the middle of the delivery
      top.session.reset();
    }
  };
  child.send(message());
  EXPECT_TRUE(watched.expired());
  EXPECT_EQ(freeAtTheEnd, true);
  EXPECT_EQ(harness.agent->parentSessionIDStringForSession(*child.session), std::nullopt)
      << "left its family";
  connection->onCall = nullptr;
}

TEST_F(FamilyLife, ADestroyedAggregatorGetsItsOwnLastMessageBeforeTheClosingOne) {
  std::shared_ptr<RecordingConnection> connection;
  {
    auto top = join(0, true);
    connection = top.connection;
    connection->calls.clear();
  }
  ASSERT_EQ(connection->calls.size(), 2u);
  EXPECT_EQ(std::get<std::uint16_t>(connection->calls[0].arguments.at(3)), 1) << "the end of the session";
  EXPECT_FALSE(infoOf(connection->calls[1]));
  {
    auto top = join(0, true);
    connection = top.connection;
    connection->calls.clear();
    top->shutdownSessionAggregation();
    top->shutdownSessionAggregation();
  }
  EXPECT_EQ(connection->calls.size(), 1u) << "the closing one, once";
}

TEST_F(FamilyLife, ASessionThatMovesTakesItsHeldEventsAlongAndItsNextMessageGoesToTheNewAncestor) {
  CapturedLog log;
  auto top = join(0);
  auto other = join(0, true, "Other");
  auto child = join(1, false, "MyApp", true);
  child.send(message(0));
  child->fetchStatesWithUserInfo(userInfo("Other"), {});
  EXPECT_EQ(log.count(7, "userInfoUpdatedForSession: Adding session 101 to list for userInfoKey other:calls"),
            1);
  other.connection->calls.clear();
  child.send(message(0));
  EXPECT_EQ(other.connection->calls.size(), 1u);
  child->flushMessagesWithReply({});
  const std::string expected = other->sessionIDString() + "." + child->sessionIDString();
  const auto events = harness.posts().back().events();
  ASSERT_GE(events.size(), 2u);
  for (const auto& event : events) EXPECT_EQ(event.at("_sessionID").as_string(), expected);
}

TEST_F(FamilyLife, ManyInventedNamesDoNotFillTheMemory) {
  auto session = join(0);
  auto families = [&] {
    CapturedLog log;
    auto connection = std::make_shared<RecordingConnection>();
    harness.agent->shouldAcceptNewConnection(connection);
    connection->invalidate();
    const std::string line = log.lines().at(0).second;
    return std::stoi(line.substr(line.find('(') + 1));
  };
  auto rename = [&](const std::string& name) {
    session->fetchStatesWithUserInfo(userInfo(name.c_str()), {});
  };
  for (int i = 0; i < 600; ++i) rename(std::to_string(i));
  const int before = families();
  EXPECT_GT(before, 1);
  EXPECT_LE(before, 256);
  for (int i = 0; i < 9; ++i) rename(std::string(2000, 'x') + std::to_string(i));
  EXPECT_LE(families(), before + 2) << "the present one and the one before";
}

TEST_F(FamilyLife, AClientThatTakesNoMessagesCostsOneLineAndNobodyElse) {
  CapturedLog log;
  auto parent = join(0, true);
  auto child = join(1, false, "MyApp", true);
  parent.connection->clientIsGone = true;
  for (int i = 0; i < 100; ++i) child.send(message(0));
  child->flushMessagesWithReply({});
  std::size_t posted = 0;
  for (const auto& post : harness.posts()) {
    for (const auto& event : post.events()) posted += event.at("_method") == 3;
  }
  EXPECT_EQ(posted, 100u) << "the sender does not notice";
  EXPECT_EQ(harness.dropped(DropReason::NotAggregated), 100u);
  EXPECT_EQ(log.count(3, "sendMessageWithDictionary: Failed to get remote object proxy: gone"), 1);
}

}  // namespace
}  // namespace vesk::test
