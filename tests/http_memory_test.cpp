// The HTTP client when memory runs out: what was asked for ends, and what is asked for next succeeds.
#include <gtest/gtest.h>

#include "tests/support/HTTPRequests.h"
#include "tests/support/RecordingServer.h"
#include "tests/support/ScarceMemory.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;

TEST(HTTPMemory, EveryRequestEndsAndTheNextSucceedsWhereverMemoryRunsOut) {
  RecordingServer server([](const HTTPReceived&, std::size_t) {
    auto answer = HTTPAnswer::text(200, std::string(50'000, 'x'));
    answer.headers.emplace_back("X-Long", std::string(100, 'x'));
    return answer;
  });
  const std::string gone = [] { return RecordingServer().url(); }();
  const struct {
    const char* what;
    const char* thread;
    bool lasting;
  } cases[] = {
      {"once on the client's thread", "http", false},
      {"for long on the client's thread", "http", true},
      {"once on the caller's", nullptr, false},
      {"for long on the caller's", nullptr, true},
  };
  for (const auto& test : cases) {
    long n = 0;
    for (bool ranOut = true; ranOut;) {
      SCOPED_TRACE(std::string(test.what) + ", allocation " + std::to_string(++n));
      HTTPClient client(HTTPClient::Options{.retryFor = 10ms, .firstRetryAfter = 1ms});
      HTTPRequest requests[] = {postTo(gone), postTo(gone), fetchFrom("ftp://host/"), postTo(server.url())};
      HTTPRequest fetch = fetchFrom(server.url());
      fetch.headers = {{"X-Long", std::string(100, 'x')}};
      std::atomic<int> completions{0};

      std::optional<ScarceMemory> scarce(std::in_place, n, test.lasting, test.thread);
      for (auto& request : requests) {
        client.start(std::move(request), [&](const HTTPResult&) { ++completions; });
      }
      const HTTPResult result = client.perform(std::move(fetch));
      if (!test.thread) scarce.reset();
      const bool isIdle = client.waitUntilIdle(20s);
      scarce.reset();

      ranOut = ScarceMemory::hasRunOut();
      ASSERT_TRUE(isIdle);
      EXPECT_EQ(completions, 4);
      EXPECT_TRUE(result.response || result.error);
      ASSERT_TRUE(client.perform(fetchFrom(server.url())).response);
    }
    EXPECT_GT(n, 5) << test.what;
  }
}

}  // namespace
}  // namespace vesk::test
