// Sends one message with the argument as its text, and waits for the daemon's answer.
#include <VeskReporting/VeskReporting.h>

#include <chrono>
#include <cstdio>

int main(int argc, char** argv) {
  using namespace vesk;
  using namespace std::chrono_literals;
  VeskReporting reporting;
  // A service would not wait here: it sends, and its messages wait until the daemon is there.
  auto connected = reporting.connect(2s);
  if (!connected) {
    std::fprintf(stderr, "cpp_client: %s (%s)\n", describe(connected.status), connected.detail.c_str());
    return 1;
  }
  // The user's consent and the storebag's rules for this client apply.
  ReportingStatus configured =
      reporting.setSessionInfo(ReportingSession{.clientType = 5, .clientName = "Camera"});
  if (configured != ReportingStatus::Queued) return 1;

  auto started = reporting.startConfig(20s);  // the daemon may have to fetch the storebag
  if (!started) {
    std::fprintf(stderr, "cpp_client: not started: %s %s\n", describe(started.status),
                 started.detail.c_str());
    return 1;
  }
  auto sent = reporting.sendMessageAndWait(3, 1, Dictionary{{"text", argc > 1 ? argv[1] : "hello"}}, 5s);
  if (!sent) {
    std::fprintf(stderr, "cpp_client: not sent: %s %s\n", describe(sent.status), sent.detail.c_str());
    return 1;
  }
  std::printf("%s\n", sent.answer.value_or("accepted").c_str());
}
