// What the log tells of events that are lost.
#include <gtest/gtest.h>

#include "backends/RefusedPosts.h"
#include "tests/support/BackendHarness.h"
#include "tests/support/CapturedLog.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;

TEST(RefusedPosts, OneLineABurstCountsTheEvents) {
  const struct {
    const char* backend;
    long status;
    std::size_t events;
    std::chrono::seconds at;
    const char* line;  // null: none
  } cases[] = {
      {"httpPost", 404, 3, 0s, "backend httpPost: server answered 404, events lost: 3"},
      {"httpPost", 404, 50, 1s, nullptr},
      {"httpPost2", 302, 1, 1s, "backend httpPost2: server answered 302, events lost: 1"},
      {"httpPost", 410, 7, 10s, nullptr},
      {"httpPost", 302, 1, 20s, "backend httpPost: server answered 302, events lost: 58"},
      {"httpPost", 404, 2, 60s, "backend httpPost: server answered 404, events lost: 2"},
  };
  RefusedPosts refused;
  for (const auto& test : cases) {
    CapturedLog log;
    refused.note(test.backend, test.status, test.events, RefusedPosts::Instant(1h) + test.at);
    std::vector<std::pair<int, std::string>> expected;
    if (test.line) expected = {{4, std::string("HTTPSPostBackend(postJsonMessage): ") + test.line}};
    EXPECT_EQ(log.lines(), expected) << test.at.count();
  }
}

TEST(RefusedPosts, AnAnswerThatIsNeitherSuccessNorAnErrorIsNoted) {
  BackendHarness harness;
  CapturedLog log;
  auto backend = VeskReportingBackend::newBackendWithName(
      kVeskReportingBackendHTTPPost, Dictionary{{"clients", List{Dictionary{{"post_url", harness.url()}}}}},
      Text("Phone"), 5, harness.services);
  backend->updateState();
  for (unsigned status : {200u, 404u, 503u}) {
    harness.answerWith(status);
    backend->sendMessage(Dictionary(), timeval{}, 3, 2, 0);
    harness.posts();
  }
  EXPECT_EQ(log.countContaining(4, ""), 1);
  EXPECT_EQ(log.countContaining(4, "backend httpPost: server answered 404, events lost: 1"), 1);
}

}  // namespace
}  // namespace vesk::test
