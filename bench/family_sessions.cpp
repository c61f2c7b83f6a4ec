// Keeps many sessions in families, for bench/family_cost.
//
// Usage: family_sessions SOCKET FIRST COUNT [FAMILY-SIZE]
// Starts the sessions FIRST to FIRST + COUNT - 1, five (or FAMILY-SIZE, if smaller) per family in three
// levels, prints "ready", and ends them when its standard input ends.
#include <VeskReporting/VeskReporting.h>
#include <VeskReporting/VeskReportingKeys.h>

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>
#include <vector>

namespace {

constexpr long kLargestFamily = 5;
constexpr int kLevels[kLargestFamily] = {0, 1, 1, 2, 2};

std::unique_ptr<vesk::VeskReporting> startSession(const char* socket, long number, long familySize) {
  vesk::ReportingOptions options;
  options.socketPath = socket;
  auto session = std::make_unique<vesk::VeskReporting>(options);
  const vesk::Dictionary user{
      {vesk::kVeskReportingUserInfoClientName, "Family " + std::to_string(number / familySize)},
      {vesk::kVeskReportingUserInfoServiceName, "Bench"}};
  auto configured = session->setSessionInfo(
      vesk::Dictionary{{vesk::kVeskReportingSessionInfoSessionID, number},
                       {vesk::kVeskReportingSessionInfoClientType, 5 + kLevels[number % familySize]},
                       {vesk::kVeskReportingSessionInfoRequireUserInfo, true},
                       {vesk::kVeskReportingSessionInfoBatchEvent, true}},
      user);
  auto started = session->startConfig();
  if (configured != vesk::ReportingStatus::Queued || !started || !started.answer) {
    std::fprintf(stderr, "family_sessions: session %ld does not start: %s %s\n", number,
                 vesk::describe(started.status), started.detail.c_str());
    return nullptr;
  }
  return session;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 4) return 2;
  const long first = std::strtol(argv[2], nullptr, 10);
  const long count = std::strtol(argv[3], nullptr, 10);
  const long familySize = argc > 4 ? std::strtol(argv[4], nullptr, 10) : kLargestFamily;
  if (familySize < 1 || familySize > kLargestFamily) return 2;
  std::vector<std::unique_ptr<vesk::VeskReporting>> sessions;
  for (long number = first; number < first + count; ++number) {
    sessions.push_back(startSession(argv[1], number, familySize));
    if (!sessions.back()) return 1;
  }
  std::puts("ready");
  std::fflush(stdout);
  while (std::getchar() != EOF) {
  }
  return 0;
}
