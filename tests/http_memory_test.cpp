// The HTTP client when memory runs out: what was asked for ends, and what is asked for next succeeds.
#include <gtest/gtest.h>
#include <sys/prctl.h>

#include <atomic>
#include <cstdlib>
#include <cstring>
#include <new>

#include "tests/support/HTTPRequests.h"
#include "tests/support/RecordingServer.h"

namespace {

enum class Victim : unsigned char { Nobody, ClientThread, Caller };

std::atomic<Victim> victim{Victim::Nobody};
std::atomic<bool> lasting{false};
std::atomic<long> allocationsLeft{0};
thread_local bool isCaller = false;

bool isVictim() {
  if (victim != Victim::ClientThread) return victim == Victim::Caller && isCaller;
  char name[16] = "";
  ::prctl(PR_GET_NAME, name);
  return std::strcmp(name, "http") == 0;
}

bool runsOut() {
  if (!isVictim()) return false;
  const long left = --allocationsLeft;
  return left == 0 || (left < 0 && lasting);
}

}  // namespace

void* operator new(std::size_t size) {
  void* memory = runsOut() ? nullptr : std::malloc(size > 0 ? size : 1);
  if (!memory) throw std::bad_alloc();
  return memory;
}
void operator delete(void* memory) noexcept { std::free(memory); }
void operator delete(void* memory, std::size_t) noexcept { std::free(memory); }

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
    Victim victim;
    bool lasting;
  } cases[] = {
      {"once on the client's thread", Victim::ClientThread, false},
      {"for long on the client's thread", Victim::ClientThread, true},
      {"once on the caller's", Victim::Caller, false},
      {"for long on the caller's", Victim::Caller, true},
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

      allocationsLeft = n;
      lasting = test.lasting;
      victim = test.victim;
      isCaller = true;
      for (auto& request : requests) {
        client.start(std::move(request), [&](const HTTPResult&) { ++completions; });
      }
      const HTTPResult result = client.perform(std::move(fetch));
      isCaller = false;
      const bool isIdle = client.waitUntilIdle(20s);
      victim = Victim::Nobody;

      ranOut = allocationsLeft <= 0;
      ASSERT_TRUE(isIdle);
      EXPECT_EQ(completions, 4);
      EXPECT_NE(result.response.has_value(), result.error.has_value());
      ASSERT_TRUE(client.perform(fetchFrom(server.url())).response);
    }
    EXPECT_GT(n, 5) << test.what;
  }
}

}  // namespace
}  // namespace vesk::test
