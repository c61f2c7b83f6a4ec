// The agent: connections that come and go, and when it fetches storebags.
#include <gtest/gtest.h>

#include <future>

#include "tests/support/AgentHarness.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/TestRoot.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;
using Lines = std::vector<std::pair<int, std::string>>;

const Dictionary kFirst{{"wren", Dictionary{{"is", "first"}}}};
const Dictionary kSecond{{"wren", Dictionary{{"is", "second"}}}};

/// The result of a fetch.
struct Outcome {
  std::optional<Dictionary> section{};
  std::int32_t maxAge = 0;
  std::optional<std::string> version{};
  bool notModified = false;
  std::optional<std::string> lastModified{};
};

class AgentStorebags : public testing::Test {
 protected:
  std::shared_ptr<ReportingdSession> newSession(const Value& clientType = 7) {
    auto session =
        std::make_shared<ReportingdSession>(agent, std::make_shared<RecordingConnection>(), sessionServices);
    session->setSessionInfo(Dictionary{{kVeskReportingSessionInfoSessionID, 77},
                                       {kVeskReportingSessionInfoClientType, clientType}},
                            std::nullopt, {}, false);
    return session;
  }
  std::optional<Dictionary> fetch(std::int32_t clientType, std::int32_t& maxAge,
                                  std::optional<std::string>& version, bool& notModified,
                                  std::optional<std::string>& lastModified, FetchFacts&) {
    EXPECT_TRUE(maxAge == 0 && !version && !notModified);
    fetched.push_back(clientType);
    previous = lastModified;
    if (duringFetch) duringFetch();
    if (next.version) version = next.version;
    maxAge = next.maxAge;
    notModified = next.notModified;
    lastModified = next.lastModified;
    return next.section;
  }

  CapturedLog log;
  BackendHarness harness;
  SessionServices sessionServices{.backends = harness.services, .libraryVersion = "7.3"};
  BusyMarker busyMarker;
  Outcome next;
  std::function<void()> duringFetch;
  std::vector<std::int32_t> fetched;    // client types
  std::optional<std::string> previous;  // the last fetch's "Last-Modified"
  std::shared_ptr<ReportingdAgent> agent = std::make_shared<ReportingdAgent>(
      sessionServices, [this](auto&&... arguments) { return fetch(arguments...); }, busyMarker, std::nullopt,
      [this](std::string_view name) { return name == expired; });
  std::string expired;  ///< the name of a storebag
};

TEST_F(AgentStorebags, AnExpiredStorebagServesNobody) {
  auto session = newSession();
  next = {kFirst, 600};
  EXPECT_EQ(agent->storebagForSession(*session), kFirst);
  expired = "palvo";
  EXPECT_EQ(agent->storebagForSession(*session), std::nullopt);
  expired = "zelko";
  EXPECT_EQ(agent->storebagForSession(*session), kFirst);
}

TEST_F(AgentStorebags, FetchesByAgeAndWaitsAfterFailures) {
  enum class Does { Fetch, FetchInVain, ServeCached, Wait };
  const Outcome failure;
  const std::tuple<double, Outcome, Does, std::optional<Dictionary>, std::optional<std::string>> steps[] = {
      {0, failure, Does::FetchInVain, {}, {}},
      {899.9, {kFirst, 600}, Does::Wait, {}, {}},
      {900, {kFirst, 600, "1"}, Does::Fetch, kFirst, "1"},
      {1499.9, failure, Does::ServeCached, kFirst, "1"},
      {1500, {kSecond, 600}, Does::Fetch, kSecond, {}},  // its version disappeared
      {2100, {{}, 40, "3"}, Does::FetchInVain, kSecond, {}},
      {2999.9, {kFirst, 9}, Does::Wait, kSecond, {}},
      {3000, {{}, 60, "4", true}, Does::Fetch, kSecond, {}},
      {3059.9, failure, Does::ServeCached, kSecond, {}},
      {2940.1, failure, Does::ServeCached, kSecond, {}},  // the clock was set back
      {2940, {kFirst, 0, "5"}, Does::Fetch, kFirst, "5"},
      {2940, {kSecond, -5, "6"}, Does::Fetch, kSecond, "6"},
      {2940, {{}, 3600}, Does::FetchInVain, kSecond, "6"},
      {2040.1, {kFirst, 3600}, Does::Wait, kSecond, "6"},
      {2040, {kFirst, 86400, "7"}, Does::Fetch, kFirst, "7"},
      {-84359.9, failure, Does::ServeCached, kFirst, "7"},
      {-84360, {kSecond, 5, "8"}, Does::Fetch, kSecond, "8"}};
  auto session = newSession();
  EXPECT_EQ(agent->storebagVersionForSession(*session), std::nullopt);
  for (const auto& [at, outcome, does, served, version] : steps) {
    SCOPED_TRACE(at);
    harness.clock.set(1'700'000'000 + at);
    next = outcome;
    fetched.clear();
    log.clear();
    EXPECT_EQ(agent->storebagForSession(*session), served);
    EXPECT_EQ(agent->storebagVersionForSession(*session), version);
    Lines lines{{7, "storebagForSession: Retrieving storebag for session 77 with client type 7"}};
    if (does == Does::ServeCached) {
      lines.emplace_back(7, "storebagForSession: Cached storebag found for client type 7");
    } else if (does == Does::Wait) {
      lines.emplace_back(6,
                         "storebagForSession: Not fetching storebag for client type 7 - must wait 900 "
                         "seconds between attempts");
    } else {
      lines.emplace_back(7, "fetchAndCacheStorebag: Fetching storebag for client type 7");
      lines.emplace_back(
          7, "fetchAndCacheStorebag: Storebag max age: " + std::to_string(outcome.maxAge) + " seconds");
      if (does == Does::FetchInVain)
        lines.emplace_back(3, "fetchAndCacheStorebag: Unable to fetch storebag for client type 7");
    }
    EXPECT_EQ(log.lines(), lines);
    EXPECT_EQ(fetched.size(), does == Does::Fetch || does == Does::FetchInVain ? 1u : 0u);
  }
}

TEST_F(AgentStorebags, KeepsOneRecordAStorebag) {
  next = {kFirst, 60, "1"};
  const std::tuple<Value, std::vector<std::int32_t>, bool> cases[] = {
      {7, {7}, true}, {11, {}, true}, {5, {5}, true},  {"6", {}, false}, {6, {6}, true},
      {4, {}, false}, {0, {}, false}, {12, {}, false}, {-1, {}, false},  {"?", {}, false}};
  for (const auto& [clientType, fetches, isServed] : cases) {
    SCOPED_TRACE(describe(clientType));
    fetched.clear();
    auto session = newSession(clientType);
    EXPECT_EQ(agent->storebagForSession(*session), isServed ? std::optional(kFirst) : std::nullopt);
    EXPECT_EQ(agent->storebagVersionForSession(*session),
              isServed ? std::optional<std::string>("1") : std::nullopt);
    EXPECT_EQ(fetched, fetches);
  }
  auto unconfigured =
      std::make_shared<ReportingdSession>(agent, std::make_shared<RecordingConnection>(), sessionServices);
  log.clear();
  EXPECT_FALSE(agent->storebagForSession(*unconfigured));
  EXPECT_EQ(log.lines(),
            (Lines{{7, "storebagForSession: Retrieving storebag for session 0 with client type 0"}}));
}

TEST_F(AgentStorebags, AsksForWhatIsNewerThanItsLastAnswer) {
  auto session = newSession();
  // The date is kept even if the storebag is not verified. There is nothing to serve until its age is over.
  next.lastModified = "Mon";
  EXPECT_FALSE(agent->storebagForSession(*session));
  EXPECT_EQ(previous, std::nullopt);
  harness.clock.advance(900s);
  next = {{}, 60, {}, true, "Mon"};
  EXPECT_FALSE(agent->storebagForSession(*session));
  EXPECT_EQ(previous, "Mon");
  harness.clock.advance(59s);
  EXPECT_FALSE(agent->storebagForSession(*session));
  EXPECT_EQ(fetched.size(), 2u);
  harness.clock.advance(1s);
  next = {kFirst, 0, {}, false, "Tue"};
  EXPECT_EQ(agent->storebagForSession(*session), kFirst);
  next = {};  // an answer without a date
  EXPECT_EQ(agent->storebagForSession(*session), kFirst);
  EXPECT_EQ(previous, "Tue");
  harness.clock.advance(900s);
  EXPECT_EQ(agent->storebagForSession(*session), kFirst);
  EXPECT_EQ(previous, "Tue");
  EXPECT_EQ(fetched.size(), 5u);
}

TEST_F(AgentStorebags, AKeptStorebagSeedsTheRecordAndSpreadsTheFetches) {
  double random = 0.5;
  std::chrono::seconds uptime = 100s;
  agent = std::make_shared<ReportingdAgent>(
      sessionServices, [this](auto&&... arguments) { return fetch(arguments...); }, busyMarker,
      KeptStorebagSource{.load =
                             [](std::int32_t) {
                               return KeptSection{kFirst, "kept", "Mon"};
                             },
                         .random = [&random] { return random; },
                         .uptime = [&uptime] { return uptime; }});
  auto session = newSession();
  EXPECT_EQ(agent->storebagForSession(*session), kFirst);
  EXPECT_EQ(agent->storebagVersionForSession(*session), "kept");
  harness.clock.advance(349s);
  EXPECT_EQ(agent->storebagForSession(*session), kFirst);
  EXPECT_EQ(fetched.size(), 0u) << "half of 15 minutes after the device's start are not over";
  harness.clock.advance(1s);
  EXPECT_EQ(agent->storebagForSession(*session), kFirst);
  EXPECT_EQ(previous, "Mon");
  EXPECT_EQ(fetched.size(), 1u);
  EXPECT_EQ(agent->storebagForSession(*session), kFirst);
  EXPECT_EQ(fetched.size(), 1u) << "a failure waits for 900 seconds";
  harness.clock.advance(900s);
  next = {kSecond, 1000, "2"};
  EXPECT_EQ(agent->storebagForSession(*session), kSecond);
  harness.clock.advance(949s);
  EXPECT_EQ(agent->storebagForSession(*session), kSecond);
  EXPECT_EQ(fetched.size(), 2u);
  harness.clock.advance(1s);
  EXPECT_EQ(agent->storebagForSession(*session), kSecond);
  EXPECT_EQ(fetched.size(), 3u) << "the age is shortened by half of a tenth";

  uptime = 451s;
  EXPECT_EQ(agent->storebagForSession(*newSession(5)), kSecond);
  EXPECT_EQ(fetched.size(), 4u) << "its time is over";
}

TEST_F(AgentStorebags, HoldsItsMonitorDuringAFetchAndNoLonger) {
  auto session = newSession();
  auto other = newSession(5);
  std::vector<std::future<void>> others;
  duringFetch = [&] {
    others.push_back(std::async(std::launch::async, [&] { RecursiveMutexLock lock(agent->monitor()); }));
    others.push_back(std::async(std::launch::async, [&] { agent->storebagVersionForSession(*other); }));
    others.push_back(std::async(std::launch::async, [&] { agent->userInfoUpdatedForSession(*other); }));
    for (auto& each : others) EXPECT_EQ(each.wait_for(30ms), std::future_status::timeout);
    throw std::runtime_error("out of memory");
  };
  EXPECT_THROW(agent->storebagForSession(*session), std::runtime_error);
  for (auto& each : others) each.get();
  duringFetch = nullptr;
  next.section = kFirst;
  EXPECT_EQ(agent->storebagForSession(*session), kFirst) << "no attempt has ended before";
}

TEST_F(AgentStorebags, CountsItsConnectionsAndTheCallsThatTheyLose) {
  std::vector<std::shared_ptr<RecordingConnection>> connections;
  for (const char* counts : {"0(0)", "1(0)", "2(0)", "0(0)"}) {
    if (connections.size() == 3)
      for (auto& each : connections) each->invalidate();
    connections.push_back(std::make_shared<RecordingConnection>());
    log.clear();
    EXPECT_TRUE(agent->shouldAcceptNewConnection(connections.back()));
    EXPECT_EQ(log.count(7, "listener: Accepting new Orvo connection recording connection, " +
                               std::string(counts) + " connections."),
              1);
  }
  connections.back()->invalidate();
  connections.back()->lose(3);
  EXPECT_EQ(harness.dropped(DropReason::NotAggregated), 3u);
}

}  // namespace
}  // namespace vesk::test
