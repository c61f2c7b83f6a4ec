// A family over the real processes: what its clients and the collector get, and its end with the daemon.
#include <gtest/gtest.h>

#include <algorithm>
#include <future>

#include "tests/support/DaemonHarness.h"

namespace vesk::test {
namespace {

TEST(FamilyRoad, TheDaemonEndsWithAFamilyAliveAndLosesNothingOfIt) {
  DaemonHarness harness;
  harness.writeStorebag("brannic", R"(
version = "child"
[[release.httpPost.clients]]
post_url = "@EVENTS@"
hierarchy = 1
locale_whitelist = ["US"]
filters = []
)");
  harness.startDaemon();
  const Dictionary user{{kVeskReportingUserInfoClientName, "Camera"},
                        {kVeskReportingUserInfoServiceName, "Clips"}};
  std::vector<AggregatedMessage> received;  // the handler's until it is closed
  std::promise<void> closed;
  RoadClient parent(harness, Dictionary{{kVeskReportingSessionInfoSessionID, 70}}, user,
                    [&](const AggregatedMessage& message) {
                      if (message.isClosing()) return closed.set_value();
                      received.push_back(message);
                    });
  RoadClient child(
      harness,
      Dictionary{{kVeskReportingSessionInfoClientType, 6},
                 {kVeskReportingSessionInfoRequireUserInfo, true},
                 {kVeskReportingSessionInfoBatchEvent, true}},
      Dictionary{{kVeskReportingUserInfoClientName, "CAMERA"}, {kVeskReportingUserInfoServiceName, "clips"}});
  ASSERT_TRUE(child.reporting.sendMessageAndWait(3, 2, Dictionary{{"frames", 240}}, ChildProcess::kPatience));
  EXPECT_EQ(harness.stopDaemon(), 0);
  ASSERT_EQ(closed.get_future().wait_for(ChildProcess::kPatience), std::future_status::ready);

  auto message =
      std::find_if(received.begin(), received.end(), [](const auto& m) { return m.category == 3; });
  ASSERT_NE(message, received.end());
  EXPECT_EQ(message->sessionInfo->find(kVeskReportingSessionInfoSessionID)->asInteger(), 77);
  EXPECT_EQ(message->type, 2);
  EXPECT_EQ(message->payload, (Dictionary{{"frames", 240}}));
  EXPECT_GT(message->timestamp, 1'700'000'000);
  const auto held = harness.waitForEventsOfMethod(3, 1).at(0);
  const std::string identity(held.at("event").at("_sessionID").as_string());
  EXPECT_EQ(identity.size(), 24u + 1 + 24) << identity;
  EXPECT_EQ(harness.waitForEventsOfMethod(0, 4).size(), 4u) << "start and end of both";
}

}  // namespace
}  // namespace vesk::test
