// One client of the end-to-end bench: sends numbered messages as fast as the daemon takes them.
//
// Usage: load_client SOCKET CLIENT COUNT [FLAG]
// Message ids are CLIENT * 10,000,000 and up. Prints its own CPU time per message in microseconds.
#include <VeskReporting/VeskReporting.h>
#include <VeskReporting/VeskReportingKeys.h>
#include <sys/resource.h>

#include <cstdio>
#include <cstdlib>
#include <thread>

namespace {

constexpr long kIdsPerClient = 10'000'000;

double cpuMicroseconds() {
  rusage usage{};
  ::getrusage(RUSAGE_SELF, &usage);
  return (usage.ru_utime.tv_sec + usage.ru_stime.tv_sec) * 1e6 + usage.ru_utime.tv_usec +
         usage.ru_stime.tv_usec;
}

vesk::Dictionary message(long id, int flag) {
  using vesk::Text;
  return vesk::Dictionary{
      {Text::literal("category"), 3},
      {Text::literal("type"), 2},
      {Text::literal("flag"), flag},
      {Text::literal("payload"), vesk::Dictionary{{Text::literal("msgid"), id},
                                                  {Text::literal("view"), "Preferences/Network"},
                                                  {Text::literal("username"), "someone@example"},
                                                  {Text::literal("secret"), "do-not-send"},
                                                  {Text::literal("duration"), 12.75},
                                                  {Text::literal("count"), 42},
                                                  {Text::literal("result"), "completed-ok"},
                                                  {Text::literal("ratio"), 0.3333}}}};
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 4) return 2;
  vesk::ReportingOptions options;
  options.socketPath = argv[1];
  options.drainTime = std::chrono::seconds(60);
  const long client = std::strtol(argv[2], nullptr, 10);
  const long count = std::strtol(argv[3], nullptr, 10);
  const int flag = argc > 4 ? std::atoi(argv[4]) : 0;
  vesk::VeskReporting reporting(options);
  vesk::Dictionary session{{vesk::kVeskReportingSessionInfoSessionID, client},
                           {vesk::kVeskReportingSessionInfoClientType, 5},
                           {vesk::kVeskReportingSessionInfoRequireUserInfo, true},
                           {vesk::kVeskReportingSessionInfoBatchEvent, true}};
  vesk::Dictionary user{{vesk::kVeskReportingUserInfoClientName, "Bench"},
                        {vesk::kVeskReportingUserInfoServiceName, "EndToEnd"}};
  if (reporting.setSessionInfo(session, user) != vesk::ReportingStatus::Queued) return 1;
  auto started = reporting.startConfig();
  if (!started || !started.answer || started.answer->empty()) {
    std::fprintf(stderr, "load_client: the session does not start: %s\n", started.detail.c_str());
    return 1;
  }
  double before = cpuMicroseconds();
  for (long i = 0; i < count;) {
    auto status = reporting.sendMessage(message(client * kIdsPerClient + i, flag));
    if (status == vesk::ReportingStatus::Queued) {
      ++i;
    } else if (status == vesk::ReportingStatus::QueueFull) {
      // The bench wants every message to arrive: wait, as a careful client may, for the daemon to catch up.
      std::this_thread::sleep_for(std::chrono::milliseconds(2));
    } else {
      std::fprintf(stderr, "load_client: %s\n", vesk::describe(status));
      return 1;
    }
  }
  auto flushed = reporting.flushMessagesAndWait(std::chrono::seconds(120));
  double cpu = cpuMicroseconds() - before;
  if (!flushed) {
    std::fprintf(stderr, "load_client: flush: %s %s\n", vesk::describe(flushed.status),
                 flushed.detail.c_str());
    return 1;
  }
  std::printf("%.3f\n", cpu / static_cast<double>(count));
  return 0;
}
