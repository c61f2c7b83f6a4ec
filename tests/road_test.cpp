// The whole road on real processes: client library, daemon in its sandbox, signed storebag, TLS collector.
#include <gtest/gtest.h>

#include <algorithm>

#include "tests/support/DaemonHarness.h"

namespace vesk::test {
namespace {

TEST(Road, MessagesArriveFilteredSampledAndSigned) {
  DaemonHarness harness;
  harness.writeStorebag("zelko", R"(
version = "2024.2"
[[release.httpPost.clients]]
client = "Camera"
locale_whitelist = ["US"]
sampling_threshold = 1.0
expedite = 0
post_url = "@EVENTS@"
realtime_post_url = "@EVENTS@/now"
[[release.httpPost.clients.filters]]
key = "secret"
action = "remove"
[[release.httpPost.clients.filters]]
key = "USERNAME"
action = "sha256"
)");
  harness.startDaemon();
  const Dictionary user{{kVeskReportingUserInfoClientName, "Camera"},
                        {kVeskReportingUserInfoServiceName, "Clips"}};
  {
    RoadClient client(harness, Dictionary{{kVeskReportingSessionInfoRequireUserInfo, true}}, user);
    EXPECT_EQ(client.enabled, BackendNames{"httpPost"});
    ASSERT_TRUE(queued(client.reporting.sendMessage(
        message(3, Dictionary{{"username", "Ann"}, {"secret", "x"}, {"frames", 240}, {"ratio", 0.5}}))));
    ASSERT_TRUE(queued(client.reporting.sendMessage(message(4, Dictionary{{"when", Date{12.5}}}, 1))));
    auto now = harness.waitForEventsOfMethod(4, 1).at(0);
    EXPECT_TRUE(std::string(now.at("path").as_string()).ends_with("/now"))
        << "realtime does not wait for the batch";
    EXPECT_EQ(now.at("event").at("when"), 12.5);
    EXPECT_EQ(now.at("headers").at("X-Vesk-Event-Map"), "4 2");
    auto flushed = client.reporting.flushMessagesAndWait();
    ASSERT_TRUE(flushed) << flushed.detail;
    ASSERT_TRUE(flushed.answer);
    EXPECT_NE(flushed.answer->find("\"frames\": 240"), std::string::npos);
  }
  auto held = harness.waitForEventsOfMethod(3, 1).at(0);
  const auto& event = held.at("event").as_object();
  EXPECT_EQ(event.at("username"), "17239b6e250110330eda64a29c610bf146f89883371fab093feda03bec61b646")
      << "the digest of Ann";
  EXPECT_FALSE(event.contains("secret"));
  EXPECT_EQ(event.at("frames"), 240);
  EXPECT_EQ(event.at("_sender"), "HD");
  EXPECT_EQ(event.at("clientName"), "Camera");
  EXPECT_EQ(held.at("headers").at("X-Vesk-Client-Name"), "Camera");
  EXPECT_EQ(held.at("headers").at("X-Vesk-Sender"), "HD");
  // The start message and the end of the session frame the client's own.
  auto internal = harness.waitForEventsOfMethod(0, 2);
  EXPECT_TRUE(std::any_of(internal.begin(), internal.end(), [](const auto& post) {
    auto version = post.at("event").as_object().if_contains("StorebagVersion");
    return version && *version == "2024.2";
  })) << "posts of different times may overtake each other";
  EXPECT_NE(harness.messageLog().find("[httpPost -> flushMessages]"), std::string::npos);
  EXPECT_EQ(harness.stopDaemon(), 0);
}

TEST(Road, AStalledCollectorDoesNotHoldUpTheEndForEver) {
  DaemonHarness harness;
  harness.startDaemon();
  RoadClient client(harness);
  harness.setFault("post=stall");
  auto handedOver = client.reporting.sendMessageAndWait(message(3, {}, 1));
  ASSERT_TRUE(handedOver) << handedOver.detail;
  EXPECT_EQ(harness.stopDaemon(), 0);
  EXPECT_TRUE(harness.daemon().waitForText(
      "<4> main: Stopping although posts are still outstanding after 10 seconds."));
}

TEST(Road, AnAnswerThatNoMessageHoldsComesCut) {
  DaemonHarness harness;
  harness.startDaemon();
  RoadClient client(harness, Dictionary{{kVeskReportingSessionInfoBatchEvent, true}});
  for (const char* letter : {"a", "b"}) {
    ASSERT_TRUE(queued(
        client.reporting.sendMessage(message(3, Dictionary{{letter, std::string(700'000, *letter)}}))));
  }
  const auto flushed = client.reporting.flushMessagesAndWait();
  ASSERT_TRUE(flushed) << flushed.detail;
  ASSERT_TRUE(flushed.answer) << "or the client would send them again";
  EXPECT_EQ(flushed.answer->size(), std::size_t{1} << 20);
  EXPECT_NE(flushed.answer->find("\n[cut: this answer has 1"), std::string::npos);
  EXPECT_EQ(harness.waitForEventsOfMethod(3, 2).size(), 2u);
}

}  // namespace
}  // namespace vesk::test
