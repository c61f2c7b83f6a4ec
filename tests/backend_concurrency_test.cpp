// Which operations of a backend may proceed while it builds a large body, and which wait.
#include <gtest/gtest.h>

#include <future>
#include <semaphore>
#include <thread>

#include "backends/BackendFactory.h"
#include "tests/support/BackendHarness.h"

namespace vesk::test {
namespace {

/// Blocks the first body under construction, when it reads the time, until the gate is opened.
class GatedClock final : public WallClock {
 public:
  WallTime now() const override {
    if (!_reached.exchange(true)) {
      _arrival.release();
      _opening.acquire();
    }
    return WallTime(std::chrono::seconds(1'700'000'000));
  }
  void waitUntilReached() const { _arrival.acquire(); }
  void open() const { _opening.release(); }

 private:
  mutable std::atomic<bool> _reached{false};
  mutable std::binary_semaphore _arrival{0};
  mutable std::binary_semaphore _opening{0};
};

class BackendConcurrency : public ::testing::Test {
 protected:
  /// Creates a backend that batches; `flag` 1 posts a message at once.
  BackendConcurrency() {
    backend = newBackendWithName(kVeskReportingBackendHTTPPost,
                                 Dictionary{{"clients", List{Dictionary{{"post_url", harness.url()},
                                                                        {"locale_whitelist", List{"US"}},
                                                                        {"filters", List{}},
                                                                        {"sampling_threshold", 1},
                                                                        {"expedite", 0}}}}},
                                 {._productFamily = Text("Phone"), ._requireUserInfo = true}, services);
    backend->setUserInfoDict(Dictionary{{kVeskReportingUserInfoClientName, "Camera"}});
    backend->setCombinedSessionIDString("own");
    backend->updateState();
  }
  void send(int number, std::int32_t flag = 0) {
    backend->sendMessage(Dictionary{{"n", number}}, timeval{}, 3, 2, flag);
  }
  /// Runs the operation on another thread until it is blocked by the gate.
  template <class Operation>
  std::future<void> startHeld(Operation operation) {
    auto running = std::async(std::launch::async, operation);
    clock.waitUntilReached();
    return running;
  }
  BackendHarness harness;
  GatedClock clock;
  HTTPClient http{HTTPClient::Options{.maximumConnectionsPerHost = 1}};
  BackendServices services{.http = http,
                           .clock = clock,
                           .counters = harness.counters,
                           .networkQueues = harness.networkQueues,
                           .persistentIdentifierForDNU = harness.services.persistentIdentifierForDNU,
                           .diagnosticsSubmissionConsent = harness.services.diagnosticsSubmissionConsent,
                           .regionCode = harness.services.regionCode};
  std::shared_ptr<VeskReportingBackend> backend;
};

TEST_F(BackendConcurrency, RelativesDoNotWaitForABody) {
  for (int i = 0; i < 50; ++i) send(i);
  auto sending = startHeld([&] { send(50); });  // one more than a batch holds
  auto relatives = std::async(std::launch::async, [&] {
    EXPECT_EQ(backend->samplingThreshold()->asInteger(), 1);
    backend->setSamplingThreshold(Value(0.5));
    backend->setCorrelatedSessionID("parent.own");
    backend->setUserInfoDict(Dictionary{{kVeskReportingUserInfoClientName, "Other"}});
    EXPECT_EQ(backend->samplingThreshold()->asDouble(), 0.5);
    backend->updateState();
    EXPECT_EQ(backend->samplingThreshold()->asInteger(), 1);
  });
  EXPECT_EQ(relatives.wait_for(std::chrono::seconds(30)), std::future_status::ready);
  clock.open();
  sending.get();
  relatives.get();
  backend->flushMessages();
  ASSERT_TRUE(http.waitUntilIdle(std::chrono::seconds(60)));
  auto posts = harness.posts();
  ASSERT_EQ(posts.size(), 2u);
  EXPECT_EQ(posts[0].events().size(), 50u);
  EXPECT_EQ(posts[0].event(49).at("_sessionID"), "own") << "taken before the change";
  EXPECT_EQ(posts[0].request.header("X-Vesk-Client-Name"), "Camera");
  EXPECT_EQ(posts[1].event().at("n"), 50);
  EXPECT_EQ(posts[1].event().at("_sessionID"), "parent.own") << "held during the change";
  EXPECT_EQ(posts[1].request.header("X-Vesk-Client-Name"), "Other");
}

TEST_F(BackendConcurrency, SendsAndCleanupKeepTheirOrder) {
  send(1);
  std::vector<std::future<void>> running;
  running.push_back(startHeld([&] { backend->flushMessages(); }));
  running.push_back(std::async(std::launch::async, [&] { backend->cleanup(); }));
  for (int thread = 0; thread < 4; ++thread) {
    running.push_back(std::async(std::launch::async, [&] {
      for (int i = 0; i < 40; ++i) send(i, 1);
    }));
  }
  bool hasCleanedUp = false;
  for (int chances = 0; chances < 2000; ++chances) {
    hasCleanedUp |= running[1].wait_for(std::chrono::seconds(0)) == std::future_status::ready;
    std::this_thread::yield();
  }
  EXPECT_FALSE(hasCleanedUp);
  clock.open();
  for (auto& each : running) each.get();
  ASSERT_TRUE(http.waitUntilIdle(std::chrono::seconds(60)));
  auto posts = harness.posts();
  ASSERT_EQ(posts.size(), 161u);
  for (std::size_t i = 0; i < posts.size(); ++i)
    ASSERT_EQ(posts[i].event().at("_eventNumber"), static_cast<std::int64_t>(i + 1));
}

}  // namespace
}  // namespace vesk::test
