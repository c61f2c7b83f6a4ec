// Clients that each configure and start a session and then stay idle.
//
// Usage: idle_sessions SOCKET COUNT
// Prints "ready" once all have started, and stays until standard input ends.
#include <VeskReporting/VeskReporting.h>
#include <VeskReporting/VeskReportingKeys.h>

#include <cstdio>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <string>
#include <vector>

int main(int argc, char** argv) {
  if (argc < 3) return 2;
  vesk::ReportingOptions options;
  options.socketPath = argv[1];
  std::vector<std::unique_ptr<vesk::VeskReporting>> sessions;
  for (long i = 0; i < std::strtol(argv[2], nullptr, 10); ++i) {
    auto session = std::make_unique<vesk::VeskReporting>(options);
    vesk::Dictionary info{{vesk::kVeskReportingSessionInfoSessionID, i + 1},
                          {vesk::kVeskReportingSessionInfoClientType, 5}};
    auto started = session->setSessionInfo(info, std::nullopt) == vesk::ReportingStatus::Queued
                       ? session->startConfig(std::chrono::seconds(60))
                       : vesk::ReportingResult<vesk::BackendNamesAnswer>{};
    if (!started) {
      std::fprintf(stderr, "idle_sessions: session %ld does not start: %s\n", i, started.detail.c_str());
      return 1;
    }
    sessions.push_back(std::move(session));
  }
  std::puts("ready");
  std::fflush(stdout);
  for (std::string line; std::getline(std::cin, line);) {
  }
  return 0;
}
