// Posts that are put aside: over outages and restarts, within their bounds, and with damaged files.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>

#include <condition_variable>
#include <fstream>
#include <mutex>
#include <sstream>

#include "platform/outbox/PostOutbox.h"
#include "platform/outbox/RetryAfter.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/HTTPRequests.h"
#include "tests/support/HandClock.h"
#include "tests/support/RecordingServer.h"
#include "tests/support/TempDirectory.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;
using Outcome = PostOutbox::Outcome;
using Bodies = std::vector<std::string>;

TEST(HostBackoff, WaitsGrowToAQuarterOfAnHourAndAreSpread) {
  const HostBackoff::Instant now{};
  for (double random : {0.0, 0.5, 1.0}) {
    HostBackoff backoff;
    backoff.begin(now, random);
    for (auto wait : {30s, 90s, 270s, 810s, 900s, 900s}) {
      EXPECT_EQ(backoff.next(),
                now + std::chrono::duration_cast<HostBackoff::Duration>(wait * (0.5 + random)));
      EXPECT_FALSE(backoff.isUp());
      backoff.begin(now, 0.3);  // further posts do not delay the attempt
      backoff.failed(now, random);
    }
  }
}

TEST(HostBackoff, ResumesWhenTheHostAnswersUnlessItAskedToWait) {
  const HostBackoff::Instant now{1h};
  HostBackoff backoff;
  backoff.resume(now, 0.5);
  EXPECT_EQ(backoff.next(), now + 30s);
  backoff.hostAnswered(now);
  EXPECT_EQ(backoff.next(), now);
  backoff.failed(now, 0.5);
  backoff.failed(now, 0.5);
  backoff.networkChanged(now, 0.25);
  EXPECT_EQ(backoff.next(), now + 15s);
  backoff.held(now, 600s, 0.5);
  backoff.hostAnswered(now);
  backoff.networkChanged(now, 0.0);
  EXPECT_EQ(backoff.next(), now + 600s);
  backoff.held(now, 1000h, 0.5);
  EXPECT_EQ(backoff.next(), now + 24h) << "no server stops a device for longer";
  backoff.held(now, std::nullopt, 0.5);
  EXPECT_EQ(backoff.next(), now + 900s) << "without a wish the waits grow";
  backoff.failed(now, 0.5);
  backoff.hostAnswered(now);
  EXPECT_EQ(backoff.next(), now) << "it no longer asks to wait";
  backoff.succeeded();
  EXPECT_TRUE(backoff.isUp());
  EXPECT_LE(backoff.next(), now);
}

TEST(RetryAfter, ReadsSecondsAndDates) {
  const WallTime now{std::chrono::seconds(784111777)};  // Sun, 06 Nov 1994 08:49:37 GMT
  const struct {
    const char* header;
    std::optional<std::chrono::seconds> wait;
  } cases[] = {{"120", 120s},
               {"0", 0s},
               {"Sun, 06 Nov 1994 08:50:07 GMT", 30s},
               {"Sun, 06 Nov 1994 08:49:07 GMT", 0s},
               {"-1", std::nullopt},
               {"12 monkeys", std::nullopt},
               {"99999999999", std::nullopt},
               {"", std::nullopt}};
  for (const auto& test : cases) {
    EXPECT_EQ(retryAfter({503, {{"retry-after", test.header}}, ""}, now), test.wait) << test.header;
  }
  EXPECT_EQ(retryAfter({503, {}, ""}, now), std::nullopt);
}

class Outbox : public testing::Test {
 protected:
  ~Outbox() override { end(); }

  /// Starts an outbox and a client. Ends earlier ones as a daemon does.
  void begin(PostOutbox::Options options = {}, bool keepsFirst = false) {
    end();
    options.path = (directory / "state/outbox.sqlite").string();
    options.clock = &clock;
    options.writeWithin = 1ms;
    options.onFate = [this](const PostOutbox::Fate& fate) {
      std::lock_guard lock(mutex);
      fates[fate.outcome] += fate.events;
      changed.notify_all();
    };
    options.onWaiting = [this](bool isWaiting) {
      std::lock_guard lock(mutex);
      waiting = isWaiting;
      changed.notify_all();
    };
    outbox = std::make_unique<PostOutbox>(options);
    client = std::make_unique<HTTPClient>(HTTPClient::Options{.keeper = outbox.get(),
                                                              .keepsFirst = keepsFirst,
                                                              .retryFor = keepsFirst ? 60'000ms : 20ms,
                                                              .firstRetryAfter = 5ms});
    outbox->start(*client);
  }
  void end() {
    if (!outbox) return;
    outbox->stopSending();
    client->stop();
    outbox->stop();
    client.reset();
    outbox.reset();
  }

  HTTPRequest post(const std::string& body, std::uint32_t owner = 1) {
    auto request = postTo(server.url(), body);
    request.headers.emplace_back("X-Name", body);
    request.owner = owner;
    request.source = "httpPost";
    return request;
  }
  /// Posts and returns true if the post was put aside.
  bool isPutAside(HTTPRequest request) {
    const auto result = client->perform(std::move(request));
    return result.error && result.error->deferred;
  }
  /// An answered request, which resumes the backlog at once.
  void answerFresh() { ASSERT_TRUE(client->perform(post("fresh")).response); }
  void waitFor(Outcome outcome, std::uint64_t events) {
    std::unique_lock lock(mutex);
    changed.wait(lock, [&] { return fates[outcome] >= events; });
    EXPECT_EQ(fates[outcome], events);
  }
  void waitUntilEmpty() {
    std::unique_lock lock(mutex);
    changed.wait(lock, [&] { return !waiting; });
  }
  std::string file(const std::string& suffix = "") {
    return (directory / "state/outbox.sqlite").string() + suffix;
  }
  std::string bytesOfFiles() {
    std::string all;
    for (const char* suffix : {"", "-wal"}) {
      std::ostringstream bytes;
      bytes << std::ifstream(file(suffix), std::ios::binary).rdbuf();
      all += bytes.str();
    }
    return all;
  }

  CapturedLog log;
  TempDirectory directory;
  HandClock clock{1'800'000'000};
  RecordingServer server;
  std::mutex mutex;
  std::condition_variable changed;
  std::map<Outcome, std::uint64_t> fates;
  bool waiting = false;
  std::unique_ptr<PostOutbox> outbox;
  std::unique_ptr<HTTPClient> client;
};

TEST_F(Outbox, SendsOldestFirstOnceTheHostAnswers) {
  begin();
  EXPECT_FALSE(std::ifstream(file()).good()) << "nothing is written while all goes well";
  server.stop();
  for (const char* body : {"1", "2", "3"}) EXPECT_TRUE(isPutAside(post(body)));
  server.start();
  answerFresh();
  waitFor(Outcome::Delivered, 3);
  waitUntilEmpty();
  const auto requests = server.requests();
  auto bodies = server.bodies();
  ASSERT_EQ(bodies.size(), 4u);
  std::sort(bodies.begin() + 2, bodies.end());  // these went over two connections
  EXPECT_EQ(bodies, (Bodies{"fresh", "1", "2", "3"}));
  EXPECT_EQ(requests[1].method, "POST");
  EXPECT_EQ(requests[1].header("X-Name"), "1");
}

TEST_F(Outbox, KeepsPostsOverARestart) {
  begin();
  server.stop();
  EXPECT_TRUE(isPutAside(post("early")));
  server.answerWith(faulty(HTTPAnswer::Fault::Stall));
  server.start();
  client->start(post("hangs"), [](const HTTPResult& result) { EXPECT_TRUE(result.error->deferred); });
  while (server.count() < 1) std::this_thread::yield();
  end();
  server.answerWith(HTTPAnswer::text(200, "ok"));
  clock.advance(31s);  // the server may have been busy with the post that was interrupted
  begin();
  EXPECT_TRUE(waiting);
  answerFresh();
  waitFor(Outcome::Delivered, 2);
  EXPECT_EQ(server.bodies(), (Bodies{"hangs", "fresh", "early", "hangs"}));
}

TEST_F(Outbox, WritesPostsBeforeTheyAreSentIfItAlwaysKeepsThem) {
  std::atomic<int> unwritten = 0;
  server.answerWith([&](const HTTPReceived& request, std::size_t) {
    if (bytesOfFiles().find(request.body) == std::string::npos) ++unwritten;
    return HTTPAnswer::text(200, "");
  });
  begin({}, true);
  auto account = std::make_shared<PostBudget>(PostBudget::Limits{}, outbox.get())->accountFor(1, [](bool) {});
  Bodies sent;
  for (int i = 0; i < 100; ++i) {
    auto request = post(sent.emplace_back("body " + std::to_string(i)));
    request.account = account;
    client->start(std::move(request), [](const HTTPResult& result) {
      EXPECT_TRUE(result.response) << result.error->description;
    });
    if (i % 30 > 0) continue;
    account->waitUntilWritten();
    EXPECT_NE(bytesOfFiles().find(sent.back()), std::string::npos) << "before its call is answered";
  }
  waitUntilEmpty();
  EXPECT_EQ(unwritten, 0);
  auto received = server.bodies();
  std::sort(sent.begin(), sent.end());
  std::sort(received.begin(), received.end());
  EXPECT_EQ(received, sent) << "each once";
}

TEST_F(Outbox, AServerErrorHoldsTheRestAndAnotherRefusalDoesNot) {
  begin();
  server.stop();
  for (const char* body : {"1", "2", "3"}) EXPECT_TRUE(isPutAside(post(body)));
  server.answerWith([](const HTTPReceived& received, std::size_t) {
    return HTTPAnswer::text(received.body == "1" ? 503 : received.body == "2" ? 404 : 200, "");
  });
  server.start();
  answerFresh();
  waitFor(Outcome::Refused, 1);
  answerFresh();
  begin();
  EXPECT_EQ(server.bodies(), (Bodies{"fresh", "1", "fresh"}));
  answerFresh();
  waitFor(Outcome::Refused, 2);
  waitFor(Outcome::Delivered, 1);
  EXPECT_EQ(server.bodies(), (Bodies{"fresh", "1", "fresh", "fresh", "2", "3"}));
}

TEST_F(Outbox, WithdrawnConsentDeletesWhatRespectsItWithoutATrace) {
  begin();
  server.stop();
  auto respecting = post("a private body");
  respecting.respectsConsent = true;
  EXPECT_TRUE(isPutAside(respecting));
  EXPECT_TRUE(isPutAside(post("another")));
  end();
  EXPECT_NE(bytesOfFiles().find("a private body"), std::string::npos);
  begin();
  outbox->setConsent(false);
  waitFor(Outcome::ConsentWithdrawn, 1);
  EXPECT_EQ(bytesOfFiles().find("a private body"), std::string::npos);
  EXPECT_TRUE(isPutAside(respecting));
  waitFor(Outcome::ConsentWithdrawn, 2);
  outbox->setConsent(true);
  server.start();
  answerFresh();
  waitFor(Outcome::Delivered, 1);
  EXPECT_EQ(server.bodies(), (Bodies{"fresh", "another"}));
}

TEST_F(Outbox, TheOldestOfTheFullestUserGiveWay) {
  const std::string kilobytes(1000, 'x');
  PostOutbox::Options options;
  options.maximumBytes = 4 * OutboxStore::sizeOf(post("a" + kilobytes));
  begin(options);
  server.stop();
  for (const char* name : {"a", "b", "c", "d"}) EXPECT_TRUE(isPutAside(post(name + kilobytes, 1)));
  EXPECT_TRUE(isPutAside(post("e" + kilobytes, 2)));
  EXPECT_TRUE(isPutAside(post("f" + kilobytes, 2)));
  waitFor(Outcome::OverQuota, 2);
  EXPECT_TRUE(isPutAside(post("g" + kilobytes, 2)));
  waitFor(Outcome::OverQuota, 3);
  server.start();
  answerFresh();
  waitFor(Outcome::Delivered, 4);
  std::string names;
  for (const auto& body : server.bodies()) names += body[0];
  EXPECT_EQ(names, "fcdfg") << "the first is the fresh one; the second user gave way to itself";
}

TEST_F(Outbox, PostsExpireUnlessTheirDateIsOfAClockThatWasNotSet) {
  begin();
  server.stop();
  EXPECT_TRUE(isPutAside(post("old")));
  end();
  clock.set(1000);
  begin();
  EXPECT_TRUE(isPutAside(post("undated")));
  end();
  clock.set(1'800'000'000 + 8 * 24 * 3600);
  begin();
  waitFor(Outcome::Expired, 1);
  server.start();
  answerFresh();
  waitFor(Outcome::Delivered, 1);
  EXPECT_EQ(server.bodies(), (Bodies{"fresh", "undated"}));
}

TEST_F(Outbox, ADamagedRecordCostsOnlyItselfAndADamagedFileIsMovedAside) {
  begin();
  server.stop();
  for (const char* body : {"whole", "broken", "sound"}) EXPECT_TRUE(isPutAside(post(body)));
  end();
  std::string bytes = bytesOfFiles();
  bytes.replace(bytes.rfind("broken"), 6, "Broken");
  std::ofstream(file(), std::ios::binary) << bytes;
  begin();
  server.start();
  answerFresh();
  waitFor(Outcome::Damaged, 1);
  waitFor(Outcome::Delivered, 2);
  EXPECT_EQ(server.bodies(), (Bodies{"fresh", "whole", "sound"}));
  end();

  std::ofstream(file(), std::ios::binary) << std::string(5000, 'x');
  begin();
  EXPECT_EQ(log.countContaining(3, "is damaged"), 1);
  EXPECT_TRUE(std::ifstream(file(".damaged")).good());
  server.stop();
  EXPECT_TRUE(isPutAside(post("later")));
  server.start();
  answerFresh();
  waitFor(Outcome::Delivered, 3);
}

TEST_F(Outbox, ADamagedPageCostsOnlyThePostsOnIt) {
  constexpr std::size_t kPage = 4096, kPosts = 40;
  begin();
  server.stop();
  for (std::size_t i = 0; i < kPosts; ++i) {
    EXPECT_TRUE(isPutAside(post(std::to_string(i) + std::string(700, 'x'))));
  }
  end();
  const std::string whole = bytesOfFiles();
  ASSERT_GT(whole.size(), 10 * kPage);
  server.start();
  std::size_t lostWhole = 0;
  for (std::size_t page = 1; page < whole.size() / kPage; ++page) {
    SCOPED_TRACE(page);
    std::string bytes = whole;
    bytes.replace(page * kPage, kPage, kPage, '\xAA');
    std::ofstream(file(), std::ios::binary) << bytes;
    fates.clear();
    const std::size_t before = server.count();
    begin();
    answerFresh();
    waitUntilEmpty();
    const std::size_t late = server.count() - before - 1;
    if (late == 0) ++lostWhole;
    EXPECT_TRUE(late == 0 || (late >= kPosts - kPage / 700 && late <= kPosts)) << late;
    end();
  }
  EXPECT_EQ(lostWhole, 1u) << "with the root of the table";
}

TEST_F(Outbox, GoesOnFromMemoryWhileTheFileCanNotBeUsed) {
  directory.write("state", "a file where a directory should be");
  begin();
  server.stop();
  EXPECT_TRUE(isPutAside(post("1")));
  EXPECT_TRUE(isPutAside(post("2")));
  server.start();
  answerFresh();
  waitFor(Outcome::Delivered, 2);
  EXPECT_EQ(server.bodies(), (Bodies{"fresh", "1", "2"}));
  EXPECT_EQ(log.countContaining(3, "posts are kept in memory"), 1) << "one line for one cause";
  server.stop();
  EXPECT_TRUE(isPutAside(post("3")));
  end();
  EXPECT_EQ(fates[Outcome::NotWritten], 1u) << "what ends with the process is counted";
}

TEST_F(Outbox, WritesWhatADiskThatWasFullDidNotTake) {
  begin();
  server.stop();
  EXPECT_TRUE(isPutAside(post("early")));
  while (bytesOfFiles().find("early") == std::string::npos) std::this_thread::yield();
  rlimit limit{};
  ::getrlimit(RLIMIT_FSIZE, &limit);
  const rlimit full{bytesOfFiles().size() / 2, limit.rlim_max};
  ::signal(SIGXFSZ, SIG_IGN);
  ::setrlimit(RLIMIT_FSIZE, &full);
  auto large = post("late");
  large.body.resize(100'000);
  EXPECT_TRUE(isPutAside(std::move(large)));
  while (log.countContaining(3, "posts are kept in memory") == 0) std::this_thread::yield();
  ::setrlimit(RLIMIT_FSIZE, &limit);
  end();
  EXPECT_EQ(fates[Outcome::NotWritten], 0u);
  begin();
  server.start();
  answerFresh();
  waitFor(Outcome::Delivered, 2);
}

TEST_F(Outbox, ASecondProcessIsRefusedTheFile) {
  begin();
  server.stop();
  EXPECT_TRUE(isPutAside(post("1")));
  while (bytesOfFiles().empty()) std::this_thread::yield();
  PostOutbox::Options options;
  options.path = file();
  PostOutbox second(options);
  EXPECT_TRUE(second.keep(post("2"), 0s));
  while (log.countContaining(3, "another process uses the file") == 0) std::this_thread::yield();
}

}  // namespace
}  // namespace vesk::test
