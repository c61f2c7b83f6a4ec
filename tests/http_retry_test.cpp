// When posts are retried, and in what order requests go out, without real waits.
#include <gtest/gtest.h>

#include "platform/http/HTTPSchedule.h"
#include "platform/http/RetryPolicy.h"

namespace vesk {
namespace {

using namespace std::chrono_literals;
using Instant = RetryPolicy::Instant;

TEST(RetryPolicy, WaitsGrowAreSpreadAndEnd) {
  const RetryPolicy policy{60s, 200ms, 10s};
  const Instant first{};
  const struct {
    unsigned failures;
    std::chrono::milliseconds since;
    double random;
    std::optional<std::chrono::milliseconds> wait;
  } cases[] = {
      {1, 0ms, 0.5, 200ms},        {2, 200ms, 0.5, 400ms}, {3, 1s, 0.5, 800ms},
      {6, 10s, 0.5, 6400ms},       {7, 20s, 0.5, 10s},     {1000, 20s, 0.5, 10s},
      {1, 0ms, 0.0, 100ms},        {7, 20s, 0.0, 5s},      {7, 20s, 0.75, 12500ms},
      {7, 55s, 0.5, 5s},           {7, 59999ms, 0.5, 1ms}, {7, 60s, 0.5, std::nullopt},
      {1, 61s, 0.5, std::nullopt},
  };
  for (const auto& test : cases) {
    auto wait = policy.waitAfter(test.failures, first, first + test.since, test.random);
    EXPECT_EQ(wait, test.wait) << test.failures << " failures, " << test.since.count() << " ms";
  }
}

class Schedule : public testing::Test {
 protected:
  explicit Schedule(const HTTPClient::Options& options = {.maximumWaiting = 100,
                                                          .maximumConnectionsPerHost = 3})
      : schedule(options) {}

  /// Adds a post, or a fetch if it is never retried.
  void add(const std::string& name, std::size_t size = 10, std::uint32_t owner = 0,
           HTTPRequest::Retry retry = HTTPRequest::Retry::UntilSent, const std::string& host = "https://a",
           bool isBackground = false) {
    HTTPRequest request;
    request.url = host + "/" + name;
    request.body = std::string(size, 'x');
    request.retry = retry;
    request.owner = owner;
    request.isBackground = isBackground;
    request.account = account;
    const auto noteFailure = [this, name](const HTTPResult& result) {
      if (result.error) givenUpNames += name;
    };
    schedule.add(std::make_unique<HTTPExchange>(std::move(request), noteFailure, now, outstanding));
  }
  void addFetch(const std::string& name) { add(name, 0, 0, HTTPRequest::Retry::Never); }
  void addInBackground(const std::string& name) {
    add(name, 0, 0, HTTPRequest::Retry::Never, "https://a", true);
  }
  void addToOtherHost(const std::string& name) {
    add(name, 1, 0, HTTPRequest::Retry::UntilSent, "https://b");
  }
  /// Takes all requests that may go out now and returns their names in order.
  std::string takeReady() {
    std::string names;
    while (auto next = schedule.next(now)) {
      names += next->request.url.substr(next->request.url.rfind('/') + 1);
      active.push_back(std::move(next));
    }
    return names;
  }
  std::string givenUp() { return std::exchange(givenUpNames, ""); }
  void failFirst() { fail({.error = {HTTPError::Kind::Connect, "down"}, .mayRetry = true, .mayKeep = true}); }
  void fail(HTTPSchedule::Failure failure) {
    schedule.failed(std::move(active.front()), std::move(failure), now);
    active.erase(active.begin());
  }
  void answerFirst() {
    schedule.answered(*active.front(), now);
    active.front()->complete({HTTPResponse(), std::nullopt});
    active.erase(active.begin());
  }

  std::string givenUpNames;
  HTTPOutstanding outstanding;
  HTTPSchedule schedule;
  Instant now{Instant{} + 1h};
  std::shared_ptr<PostAccount> account;  ///< charged for what is added
  std::vector<HTTPSchedule::Exchange> active;
};

TEST_F(Schedule, KeepsTheOrderOfAHostAndOneConnectionForFetches) {
  for (const char* name : {"1", "2", "3", "4"}) add(name);
  addToOtherHost("b");
  EXPECT_EQ(takeReady(), "12b");
  addFetch("f");
  addFetch("g");
  EXPECT_EQ(takeReady(), "f");
  answerFirst();
  EXPECT_EQ(takeReady(), "g") << "a fetch goes before posts";
  answerFirst();
  EXPECT_EQ(takeReady(), "3");
}

TEST_F(Schedule, AFailedPostComesBackBeforeThoseBehindIt) {
  for (const char* name : {"1", "2", "3", "4"}) add(name);
  EXPECT_EQ(takeReady(), "12");
  failFirst();
  EXPECT_EQ(takeReady(), "3") << "others do not wait for it";
  now = schedule.nextAdvance().value();
  schedule.advance(now);
  answerFirst();
  EXPECT_EQ(takeReady(), "1");
}

TEST_F(Schedule, InAnOutageAtMostSoManyBytesWait) {
  EXPECT_EQ(HTTPClient::Options().maximumWaiting, std::size_t{8} << 20);
  add("1", 60);
  add("2", 60);
  EXPECT_EQ(takeReady(), "12");
  failFirst();
  failFirst();
  EXPECT_EQ(givenUp(), "2");
  add("3", 40);
  add("4", 1);
  EXPECT_EQ(givenUp(), "4") << "what the queue holds counts too";
  addToOtherHost("5");
  EXPECT_EQ(givenUp(), "") << "another host is not down";
}

TEST_F(Schedule, AnAnswerEndsTheWaitOfAllAndTheOldestGoFirst) {
  for (const char* name : {"1", "2", "3"}) {
    add(name, 25);
    now += 1ms;
  }
  EXPECT_EQ(takeReady(), "12");
  failFirst();
  failFirst();
  EXPECT_EQ(takeReady(), "3");
  failFirst();
  add("4", 100);
  add("5", 10);
  EXPECT_EQ(givenUp(), "5") << "4 is about to find out whether the host is back";
  EXPECT_EQ(takeReady(), "4");
  answerFirst();
  EXPECT_EQ(takeReady(), "12") << "at once";
  failFirst();
  schedule.stopAllButPosts();
  answerFirst();
  EXPECT_EQ(takeReady(), "13") << "it waits for nothing when the daemon stops";
  EXPECT_EQ(givenUp(), "");
}

TEST_F(Schedule, PostsQueuedBehindAnOutageShareItsEnd) {
  for (const char* name : {"1", "2", "3"}) add(name);
  EXPECT_EQ(takeReady(), "12");
  now += 61s;
  add("4");
  failFirst();
  EXPECT_EQ(givenUp(), "31");

  for (const char* name : {"5", "6"}) add(name);
  now += 61s;
  answerFirst();
  EXPECT_EQ(takeReady(), "45");
  failFirst();
  EXPECT_EQ(givenUp(), "") << "a post that was just begun tells nothing of one that waits for its turn";
}

TEST_F(Schedule, OwnersTakeTurnsAndShareWhatMayWait) {
  for (const char* name : {"1", "2", "3", "4", "5"}) add(name, 10, 7);
  add("a", 10, 8);
  EXPECT_EQ(takeReady(), "1a");
  failFirst();
  failFirst();
  add("6", 40, 7);
  add("b", 30, 8);
  EXPECT_EQ(givenUp(), "234") << "who has most waiting gives way";
  add("c", 70, 8);
  EXPECT_EQ(givenUp(), "c") << "nobody comes to more than that one has";
}

/// The posts of `a`, `b` and the other user's `c` take about 2 KB each.
class Senders : public Schedule {
 protected:
  void addFrom(const std::shared_ptr<PostAccount>& sender, int posts) {
    account = sender;
    for (int i = 0; i < posts; ++i) add("1", 1000);
    account = nullptr;
  }
  void answerAll() {
    while (!takeReady().empty()) {
      while (!active.empty()) answerFirst();
    }
  }
  /// Who had to pause (-) and may continue (+) since the last call.
  std::string changes() { return std::exchange(noted, ""); }

  std::string noted;
  std::shared_ptr<PostBudget> budget = std::make_shared<PostBudget>(PostBudget::Limits{10'000, 15'000});
  PostBudget::SetPaused note(const char* name) {
    return [this, name](bool isPaused) { noted += (isPaused ? "-" : "+") + std::string(name); };
  }
  std::shared_ptr<PostAccount> a = budget->accountFor(7, note("a"));
  std::shared_ptr<PostAccount> b = budget->accountFor(7, note("b"));
  std::shared_ptr<PostAccount> c = budget->accountFor(8, note("c"));
};

TEST_F(Senders, PauseWhileTooMuchWaitsForAServerThatAnswers) {
  addFrom(a, 4);
  EXPECT_EQ(changes(), "");
  addFrom(a, 1);
  EXPECT_EQ(changes(), "-a");
  EXPECT_EQ(takeReady(), "11");
  answerFirst();
  EXPECT_EQ(changes(), "") << "not at each answer";
  answerFirst();
  answerAll();
  EXPECT_EQ(changes(), "+a");
  addFrom(a, 4);
  addFrom(b, 4);
  EXPECT_EQ(changes(), "-a-b") << "all of the user's share a limit";
  addFrom(c, 4);
  EXPECT_EQ(changes(), "") << "another user has their own";
  answerAll();
  EXPECT_EQ(changes(), "+a+b");
}

TEST_F(Senders, DoNotWaitForAnOutage) {
  addFrom(a, 5);
  EXPECT_EQ(changes(), "-a");
  EXPECT_EQ(takeReady(), "11");
  failFirst();
  EXPECT_EQ(changes(), "+a");
  addFrom(a, 9);
  EXPECT_EQ(changes(), "");
  answerFirst();
  addFrom(a, 5);
  EXPECT_EQ(changes(), "-a") << "the server answers again";
}

TEST_F(Senders, DoNotWaitForASilentServer) {
  addFrom(a, 5);
  EXPECT_EQ(takeReady(), "11");
  schedule.advance(now + 9999ms);
  EXPECT_EQ(changes(), "-a");
  EXPECT_EQ(schedule.nextAdvance(), now + 10s);
  schedule.advance(now + 10s);
  EXPECT_EQ(changes(), "+a");
}

/// Notes what it is given.
class NotingKeeper final : public PostKeeper {
 public:
  bool keep(HTTPRequest post, std::chrono::seconds delay) override {
    kept += post.url.substr(post.url.rfind('/') + 1) +
            (delay > 0s ? "(" + std::to_string(delay.count()) + ")" : "");
    return true;
  }
  Ticket keepCopy(const HTTPRequest&) override { return 1; }
  void sendLater(Ticket ticket, std::chrono::seconds delay) override {
    kept += "#" + std::to_string(ticket) + "(" + std::to_string(delay.count()) + ")";
  }
  void discard(Ticket ticket) override { kept += "-#" + std::to_string(ticket); }
  Ticket writtenUpTo() const override { return 0; }
  void waitUntilWritten(Ticket) override {}
  void hostAnswered(std::string_view) override {}

  std::string kept;
};

class KeptPosts : public Schedule {
 protected:
  KeptPosts()
      : Schedule({.maximumWaiting = 100, .keeper = &keeper, .retryFor = 5s, .maximumConnectionsPerHost = 3}) {
  }
  std::string kept() { return std::exchange(keeper.kept, ""); }
  NotingKeeper keeper;
};

TEST_F(KeptPosts, GoToTheKeeperAfterFiveSeconds) {
  add("1");
  EXPECT_EQ(takeReady(), "1");
  failFirst();
  EXPECT_EQ(kept(), "");
  now += 5s;
  schedule.advance(now);
  EXPECT_EQ(kept(), "1");
  EXPECT_EQ(givenUp(), "1");
}

TEST_F(KeptPosts, OfALongOutageAreTriedOnceIfAnotherGoesOnTrying) {
  add("1");
  EXPECT_EQ(takeReady(), "1");
  now += 4s;
  failFirst();
  add("2");
  EXPECT_EQ(takeReady(), "2");
  failFirst();
  EXPECT_EQ(kept(), "") << "the outage may be short";
  now += 1s;
  add("3");
  EXPECT_EQ(takeReady(), "3");
  failFirst();
  EXPECT_EQ(kept(), "3");
  now += 5s;
  schedule.advance(now);
  EXPECT_EQ(kept().size(), 2u);
  add("5");
  EXPECT_EQ(takeReady(), "5");
  failFirst();
  EXPECT_EQ(kept(), "") << "one always tries";
}

TEST_F(KeptPosts, BehindAHostThatDoesNotAnswerGoToTheKeeper) {
  for (const char* name : {"1", "2", "3", "4"}) add(name);
  EXPECT_EQ(takeReady(), "12");
  now += 3s;
  answerFirst();
  EXPECT_EQ(takeReady(), "3");
  EXPECT_EQ(schedule.nextAdvance(), now + 5s) << "since the last answer";
  now += 5s;
  schedule.advance(now);
  EXPECT_EQ(kept(), "4") << "not those whose attempt goes on";
}

TEST_F(KeptPosts, ThatTheServerMayHaveReceivedGoToTheKeeperAtOnceAndWait) {
  add("1");
  add("2");
  EXPECT_EQ(takeReady(), "12");
  fail({.error = {HTTPError::Kind::Interrupted, "cut off"},
        .mayRetry = true,
        .mayKeep = true,
        .wasSentWhole = true});
  EXPECT_EQ(kept(), "1(30)");
  active.front()->ticket = 7;
  fail({.error = {HTTPError::Kind::Interrupted, "cut off"},
        .mayRetry = true,
        .mayKeep = true,
        .wasSentWhole = true});
  EXPECT_EQ(kept(), "#7(30)") << "it has a copy";
  add("3");
  EXPECT_EQ(takeReady(), "3");
  active.front()->ticket = 8;
  fail({.error = {HTTPError::Kind::BadURL, "no URL"}});
  EXPECT_EQ(kept(), "-#8") << "no other attempt could succeed";
}

TEST_F(KeptPosts, OfAnOutageGoToTheKeeperWhenTheDaemonEnds) {
  for (const char* name : {"1", "2", "3"}) add(name);
  addToOtherHost("4");
  EXPECT_EQ(takeReady(), "124");
  failFirst();
  schedule.stopAllButPosts();
  EXPECT_EQ(kept(), "13") << "the other host may still answer";
  failFirst();
  EXPECT_EQ(kept(), "2") << "it is not tried again";
}

TEST_F(KeptPosts, BeyondTheBoundGoToTheKeeper) {
  add("1", 60);
  add("2", 60);
  EXPECT_EQ(takeReady(), "12");
  failFirst();
  failFirst();
  add("3", 80);
  EXPECT_EQ(kept(), "2") << "it did not fit beside the first";
  add("4", 50);
  EXPECT_EQ(kept(), "4") << "the third is about to find out whether the host is back";
}

class BackgroundRequests : public Schedule {
 protected:
  BackgroundRequests() : Schedule({.maximumConnectionsPerHost = 8}) {}
};

TEST_F(BackgroundRequests, GiveWayAndUseTwoConnections) {
  for (const char* name : {"1", "2", "3"}) addInBackground(name);
  add("p");
  EXPECT_EQ(takeReady(), "p12");
  addFetch("f");
  EXPECT_EQ(takeReady(), "f");
  answerFirst();
  EXPECT_EQ(takeReady(), "") << "the third waits for the first two";
  answerFirst();
  EXPECT_EQ(takeReady(), "3");
  addInBackground("4");
  addInBackground("5");
  schedule.stopAllButPosts();
  EXPECT_EQ(givenUp(), "45");
}

TEST_F(Schedule, AFetchThatFindsNoConnectionInTimeIsGivenUp) {
  for (const char* name : {"f", "g", "h", "i"}) addFetch(name);
  EXPECT_EQ(takeReady(), "fgh");
  EXPECT_EQ(schedule.nextAdvance(), now + 60s);
  schedule.advance(now + 59s);
  EXPECT_EQ(givenUp(), "");
  schedule.advance(now + 60s);
  EXPECT_EQ(givenUp(), "i");
}

}  // namespace
}  // namespace vesk
