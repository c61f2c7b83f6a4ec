// Sends one message, whose text is the argument, and waits until the daemon has answered.
#include <VeskReporting/VeskReporting.h>

#include <cstdio>

int main(int argc, char** argv) {
  using namespace vesk;
  VeskReporting reporting;
  ReportingStatus configured = reporting.setSessionInfo(
      {{kVeskReportingSessionInfoSessionID, 1}, {kVeskReportingSessionInfoClientType, 5}},
      Dictionary{{kVeskReportingUserInfoClientName, "Camera"}});
  if (configured != ReportingStatus::Queued) return 1;

  auto started = reporting.startConfig();
  if (!started) {
    std::fprintf(stderr, "cpp_client: %s\n", started.detail.c_str());
    return 1;
  }
  auto sent = reporting.sendMessageAndWait(3, 1, Dictionary{{"text", argc > 1 ? argv[1] : "hello"}});
  if (!sent) {
    std::fprintf(stderr, "cpp_client: %s\n", sent.detail.c_str());
    return 1;
  }
  std::printf("%s\n", sent.answer.value_or("accepted").c_str());
}
