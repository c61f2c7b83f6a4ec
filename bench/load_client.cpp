// A client of the end-to-end bench: sends numbered messages as fast as the daemon accepts them.
//
// Usage: load_client SOCKET CLIENT COUNT [FLAG [SESSIONS [ANSWERED]]]
// Message IDs start at CLIENT * 10,000,000. With several sessions, each sends 50 messages in turn. With
// ANSWERED 1, each message waits for its answer. Prints "ready", waits for a line, sends, prints its own CPU
// time per message in microseconds, and ends when its standard input does.
#include <VeskReporting/VeskReporting.h>
#include <VeskReporting/VeskReportingKeys.h>
#include <sys/resource.h>

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <thread>
#include <vector>

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

std::unique_ptr<vesk::VeskReporting> startSession(const char* socket, long client) {
  vesk::ReportingOptions options;
  options.socketPath = socket;
  options.drainTime = std::chrono::seconds(60);
  auto reporting = std::make_unique<vesk::VeskReporting>(options);
  vesk::Dictionary session{{vesk::kVeskReportingSessionInfoSessionID, client},
                           {vesk::kVeskReportingSessionInfoClientType, 5},
                           {vesk::kVeskReportingSessionInfoRequireUserInfo, true},
                           {vesk::kVeskReportingSessionInfoBatchEvent, true}};
  vesk::Dictionary user{{vesk::kVeskReportingUserInfoClientName, "Bench"},
                        {vesk::kVeskReportingUserInfoServiceName, "EndToEnd"}};
  if (reporting->setSessionInfo(session, user) != vesk::ReportingStatus::Queued) return nullptr;
  auto started = reporting->startConfig();
  if (started && started.answer && !started.answer->empty()) return reporting;
  std::fprintf(stderr, "load_client: the session does not start: %s\n", started.detail.c_str());
  return nullptr;
}

/// Returns false, after reporting the reason, if the message can't be sent.
bool send(vesk::VeskReporting& reporting, const vesk::Dictionary& message, bool isAnswered) {
  for (;;) {
    auto status = isAnswered ? reporting.sendMessageAndWait(message).status : reporting.sendMessage(message);
    if (isAnswered && status == vesk::ReportingStatus::Done) return true;
    if (status == vesk::ReportingStatus::Queued) return true;
    if (status != vesk::ReportingStatus::QueueFull) {
      std::fprintf(stderr, "load_client: %s\n", vesk::describe(status));
      return false;
    }
    // The bench needs every message to arrive, so it waits for the daemon to catch up.
    std::this_thread::sleep_for(std::chrono::milliseconds(2));
  }
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 4) return 2;
  constexpr long kBatch = 50;
  const long client = std::strtol(argv[2], nullptr, 10);
  const long count = std::strtol(argv[3], nullptr, 10);
  const int flag = argc > 4 ? std::atoi(argv[4]) : 0;
  const long sessionCount = argc > 5 ? std::strtol(argv[5], nullptr, 10) : 1;
  const bool isAnswered = argc > 6 && std::atoi(argv[6]) == 1;
  std::vector<std::unique_ptr<vesk::VeskReporting>> sessions;
  for (long i = 0; i < sessionCount; ++i) {
    sessions.push_back(startSession(argv[1], client * 1000 + i));
    if (!sessions.back()) return 1;
  }
  std::puts("ready");
  std::fflush(stdout);
  std::getchar();
  double before = cpuMicroseconds();
  for (long i = 0; i < count; ++i) {
    auto& session = *sessions[static_cast<std::size_t>(i / kBatch % sessionCount)];
    if (!send(session, message(client * kIdsPerClient + i, flag), isAnswered)) return 1;
  }
  for (auto& session : sessions) {
    auto flushed = session->flushMessagesAndWait(std::chrono::seconds(120));
    if (flushed) continue;
    std::fprintf(stderr, "load_client: flush: %s %s\n", vesk::describe(flushed.status),
                 flushed.detail.c_str());
    return 1;
  }
  std::printf("%.3f\n", (cpuMicroseconds() - before) / static_cast<double>(count));
  std::fflush(stdout);
  while (std::getchar() != EOF) {
  }
  return 0;
}
