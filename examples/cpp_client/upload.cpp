// Uploads a file, such as a crash dump, to the server that the storebag names (examples/palvo.toml).
#include <VeskReporting/VeskReporting.h>

#include <chrono>
#include <cstdio>

int main(int argc, char** argv) {
  using namespace vesk;
  using namespace std::chrono_literals;
  if (argc != 2) {
    std::fprintf(stderr, "usage: upload FILE\n");
    return 2;
  }
  VeskReporting reporting;
  auto configured = reporting.setSessionInfo(ReportingSession{.clientType = 7, .clientName = "Modem"});
  if (configured != ReportingStatus::Queued) return 1;
  auto started = reporting.startConfig(20s);
  if (!started || !started.answer) {
    std::fprintf(stderr, "upload: %s %s\n", started ? "no storebag" : describe(started.status),
                 started.detail.c_str());
    return 1;
  }
  // This program opens the file, so the daemon needs no right to read it. The daemon compresses it if that
  // helps.
  auto uploaded = reporting.uploadFile(argv[1], 60s);
  if (!uploaded) {
    std::fprintf(stderr, "upload: %s: %s %s\n", argv[1], describe(uploaded.status), uploaded.detail.c_str());
    return 1;
  }
  std::printf("%s: %s\n", argv[1], uploaded.answer ? "uploaded" : "no backend takes files");
  return uploaded.answer ? 0 : 1;
}
