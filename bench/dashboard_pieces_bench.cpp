// The cost of a datagram within the daemon, compared with the system call alone, and of its line in the
// message log. Both measure the CPU time of all threads.
#include <benchmark/benchmark.h>

#include <cstdlib>
#include <filesystem>

#include "backends/BackendFactory.h"
#include "backends/dashboard/DashboardBackend.h"
#include "backends/dashboard/DashboardText.h"
#include "platform/files/RootPrefix.h"
#include "platform/log/SystemLog.h"
#include "platform/queue/QueueThread.h"
#include "util/MessageLog.h"

namespace vesk {
namespace {

Dictionary payload() {
  return {{"msgid", 12345678},
          {"view", "Preferences/Network"},
          {"username", "someone@example"},
          {"secret", "do-not-send"},
          {"duration", 12.75},
          {"count", 42},
          {"result", "completed-ok"},
          {"ratio", 0.3333}};
}

/// Receives datagrams without reading them; a full buffer drops further ones.
struct Sink {
  Sink() {
    if (!socket.open() || !socket.bind({0x7F00'0001, 0})) std::abort();
  }
  UDPSocket socket;
};

struct Sender {
  Sender() {
    Dictionary profile{{"ip", "127.0.0.1"}, {"port", static_cast<int>(sink.socket.localEndpoint()->port)}};
    backend = newBackendWithName("dashboard", profile,
                                 {._sessionID = 77,
                                  ._compType = 5,
                                  ._udid = "0123456789abcdef0123456789abcdef01234567",
                                  ._selfVersionMajor = 7},
                                 services);
    if (!backend) std::abort();
  }
  ~Sender() {
    backend.reset();
    if (!queues.waitUntilUnused(std::chrono::seconds(10))) std::abort();
  }

  Sink sink;
  Counters counters;
  QueueThread queues;
  HTTPClient http;
  BackendServices services{
      .http = http, .clock = WallClock::system(), .counters = counters, .networkQueues = queues};
  std::shared_ptr<VeskReportingBackend> backend;
};

void sendAMessage(benchmark::State& state) {
  Sender sender;
  const Dictionary message = payload();
  const timeval now{1'700'000'000, 500'000};
  for (auto _ : state) benchmark::DoNotOptimize(sender.backend->sendMessage(message, now, 3, 2, 0));
  for (const auto& lost : sender.counters.snapshot())
    state.counters["lost"] = static_cast<double>(lost.count);
}
BENCHMARK(sendAMessage)->MeasureProcessCPUTime();

void writeTheText(benchmark::State& state) {
  const Dictionary message = payload();
  char area[kDashboardTextArea];
  for (auto _ : state) benchmark::DoNotOptimize(writePayloadText(message, area, sizeof area));
}
BENCHMARK(writeTheText);

void sendOnly(benchmark::State& state) {
  Sink sink;
  UDPSocket socket;
  if (!socket.open() || !socket.connect(*sink.socket.localEndpoint())) std::abort();
  const std::string datagram(200, 'x');
  for (auto _ : state) benchmark::DoNotOptimize(socket.send(datagram));
}
BENCHMARK(sendOnly);

void writeALogLine(benchmark::State& state) {
  const std::string line(300, 'x');
  for (auto _ : state) writeToLogFile("[%@ -> sendMessageWithDictionary] %@", "dashboard", line);
}
BENCHMARK(writeALogLine);

}  // namespace
}  // namespace vesk

int main(int argc, char** argv) {
  char root[] = "/tmp/vesk-bench.XXXXXX";
  if (::mkdtemp(root) == nullptr) return 1;
  vesk::setRootPrefix(root);
  vesk::SystemLog::setLevel(4);
  benchmark::Initialize(&argc, argv);
  benchmark::RunSpecifiedBenchmarks();
  std::filesystem::remove_all(root);
}
