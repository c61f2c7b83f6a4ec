// What operators are told about a backend is what it does, whatever a storebag says.
#include "backends/https/PostExplanation.h"
#include "tests/support/HTTPSBackendTest.h"
#include "tests/support/RandomEntries.h"

namespace vesk::test {
namespace {

using HTTPSExplanation = HTTPSBackendTest;

TEST_F(HTTPSExplanation, IsWhatTheBackendDoes) {
  const CapturedLog quiet;
  RandomEntries random(20'261'126);
  const List removesX{Dictionary{{"key", "x"}, {"action", "remove"}}};
  std::map<std::string, int> states;
  for (int round = 0; round < 2000; ++round) {
    SCOPED_TRACE(round);
    std::vector<Value> entries;
    for (int i = random.oneOf<int>({1, 1, 2, 3}); i > 0; --i) {
      entries.emplace_back(random.entry(random.oneOf<Value>({"Camera", "Camera,Phone", "Other", 7}),
                                        harness.url(), {0.0, 0.2, 0.5, 1.0, 1},
                                        {true, 7, "text", List{7}, List()}));
    }
    const List clients(std::move(entries));
    Stamp stamp{.userInfo = userNamed(random.oneOf<const char*>({"Camera", "Camera", "Phone"}), "Demo"),
                .draw = random.draw()};
    if (random.chance(0.05)) stamp.userInfo = std::nullopt;
    harness.consent = random.chance(0.8);
    harness.region = random.oneOf<std::optional<std::string>>({"US", "US", "FR", std::nullopt});

    const auto explained = explainPosts({.profile = Dictionary{{"clients", clients}},
                                         .userInfo = stamp.userInfo,
                                         .requireUserInfo = true,
                                         .productFamily = "Phone",
                                         .regionCode = harness.region,
                                         .dnuEnabled = harness.consent,
                                         .samplingFactor = stamp.draw},
                                        initialPostSettings(false));
    const auto backend = make(clients, stamp);
    const std::string state = explained.text("state")->string();
    ++states[state];
    EXPECT_EQ(nameOfState(backend->state()), state);
    const auto reason = explained.text("reason");
    EXPECT_EQ(backend->stateReason(), reason ? std::optional(reason->string()) : std::nullopt);
    send(*backend, Dictionary{{"x", "secret"}, {"y", 1}});
    backend->flushMessages();
    const auto posts = takeAll();
    const auto url = explained.text("postURL");
    const bool isPosted = state == "enabled" && url && url->view() == harness.url();
    ASSERT_EQ(posts.size(), isPosted ? 1u : 0u);
    if (posts.empty()) continue;
    EXPECT_NE(posts[0].event().contains("x"), explained.list("filters") == removesX);
    EXPECT_TRUE(posts[0].event().contains("y"));
  }
  for (const char* state : {"enabled", "disabled", "override", "pending"})
    EXPECT_GT(states[state], 20) << state << " was hardly tried";
}

}  // namespace
}  // namespace vesk::test
