// Two families of sessions that perform all operations concurrently for some seconds, with the real daemon.
#include <gtest/gtest.h>

#include <array>
#include <atomic>
#include <cstdlib>
#include <random>

#include "tests/support/DaemonHarness.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;

constexpr int kMembers = 20;
constexpr auto kDuration = 5s;
/// The watchdog: an operation that takes longer, on any machine and with any sanitizer, hangs.
constexpr auto kPatience = 60s;

/// The level of each family's ten members.
constexpr std::array<int, 10> kLevels{0, 1, 1, 1, 2, 2, 2, 2, 2, 2};

std::string storebagOfLevel(int level) {
  return "version = \"family\"\n[[release.httpPost.clients]]\npost_url = \"@EVENTS@\"\nhierarchy = " +
         std::to_string(level) +
         "\nlocale_whitelist = [\"US\"]\nsampling_threshold = 1.0\n"
         "filters = [{key = \"n\", action = \"sha256\"}]\n";
}

Dictionary familyName(int family) {
  return Dictionary{{kVeskReportingUserInfoClientName, family == 0 ? "Left" : "Right"},
                    {kVeskReportingUserInfoServiceName, "Stress"}};
}

/// One client at a time, driven by its own thread and random numbers.
class Member {
 public:
  Member(const DaemonHarness& harness, int number, unsigned seed)
      : _harness(harness),
        _level(kLevels[static_cast<std::size_t>(number) % kLevels.size()]),
        _number(number),
        _family(number / 10),
        _random(seed + static_cast<unsigned>(number)) {
    connect(chance(2));
  }

  void runUntil(const std::atomic<bool>& ends) {
    while (!ends && _problem.empty()) step();
  }

  std::uint64_t aggregated() const { return _aggregated; }
  std::string problem() const { return _problem; }

 private:
  bool chance(int of) { return std::uniform_int_distribution(0, of - 1)(_random) == 0; }
  template <class Result>
  void expect(const char* operation, const Result& result) {
    if (result || !_problem.empty()) return;
    _problem = std::string(operation) + ": " + describe(result.status) + " " + result.detail;
    if (result.status == ReportingStatus::TimedOut) _problem += ": the daemon does not answer, a DEADLOCK";
  }

  void configure(bool aggregates) {
    AggregationHandler handler;
    if (aggregates) handler = [this](const AggregatedMessage&) { ++_aggregated; };
    auto status = _reporting->setSessionInfo(Dictionary{{kVeskReportingSessionInfoSessionID, 100 + _number},
                                                        {kVeskReportingSessionInfoClientType, 5 + _level},
                                                        {kVeskReportingSessionInfoRequireUserInfo, true},
                                                        {kVeskReportingSessionInfoBatchEvent, chance(2)}},
                                             familyName(_family), {}, std::move(handler));
    if (status != ReportingStatus::Queued) _problem = describe(status);
    expect("start", _reporting->startConfig(kPatience));
  }
  void connect(bool aggregates) {
    auto options = _harness.clientOptions();
    options.maximumQueuedMessages = 64;
    options.drainTime = 2s;
    _reporting.emplace(options);
    configure(aggregates);
  }

  void step() {
    const Dictionary payload{{"n", ++_steps}};
    const int choice = std::uniform_int_distribution(0, 19)(_random);
    if (choice == 0) return _reporting.reset(), connect(chance(2));
    if (choice == 1) return configure(chance(2));
    if (choice == 2) _family = 1 - _family;
    if (choice <= 4) return expect("fetch states", _reporting->fetchStates(familyName(_family), kPatience));
    if (choice <= 6) return expect("flush", _reporting->flushMessagesAndWait(kPatience));
    if (choice <= 8) return expect("send and wait", _reporting->sendMessageAndWait(3, 2, payload, kPatience));
    const auto status = _reporting->sendMessage(3, 1, payload);
    if (status != ReportingStatus::Queued && status != ReportingStatus::QueueFull)
      _problem = describe(status);
  }

  const DaemonHarness& _harness;
  const int _level;
  const int _number;
  int _family;
  std::mt19937 _random;
  std::string _problem;
  std::uint64_t _steps = 0;
  std::atomic<std::uint64_t> _aggregated{0};
  std::optional<VeskReporting> _reporting;
};

TEST(FamilyStress, TwoFamiliesThatDoEverythingAtOnceNeitherHangNorBreakTheDaemon) {
  const char* given = std::getenv("VESK_STRESS_SEED");
  const unsigned seed =
      given ? static_cast<unsigned>(std::strtoul(given, nullptr, 10)) : std::random_device{}();
  SCOPED_TRACE("again with VESK_STRESS_SEED=" + std::to_string(seed));
  DaemonHarness harness;
  const char* names[] = {"zelko", "brannic", "palvo"};
  for (int level = 0; level < 3; ++level) harness.writeStorebag(names[level], storebagOfLevel(level));
  harness.startDaemon({"--log-level", "6"});

  std::vector<std::unique_ptr<Member>> members;
  for (int i = 0; i < kMembers; ++i) members.push_back(std::make_unique<Member>(harness, i, seed));
  std::uint64_t aggregated = 0;
  {
    std::atomic<bool> ends{false};
    std::vector<std::thread> threads;
    for (auto& member : members) threads.emplace_back([&] { member->runUntil(ends); });
    EXPECT_EQ(harness.daemon().wait(kDuration), std::nullopt) << "the daemon died:\n"
                                                              << harness.daemon().errors();
    ends = true;
    for (auto& thread : threads) thread.join();
    for (const auto& member : members) {
      EXPECT_EQ(member->problem(), "");
      aggregated += member->aggregated();
    }
    EXPECT_GT(aggregated, 0u) << "nobody ever aggregated: the families did not form";
    // Half of the members leave first; the others are still connected when the daemon ends.
    members.resize(kMembers / 2);
  }
  EXPECT_EQ(harness.stopDaemon(), 0);
}

}  // namespace
}  // namespace vesk::test
