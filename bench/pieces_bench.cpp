// The cost of each step in processing a message.
#include <VeskReporting/VeskReportingKeys.h>
#include <benchmark/benchmark.h>
#include <sys/socket.h>

#include <cstdlib>
#include <filesystem>

#include "backends/BackendFactory.h"
#include "platform/files/FileDescriptor.h"
#include "platform/files/RootPrefix.h"
#include "platform/ipc/MessageReader.h"
#include "platform/ipc/MessageWriter.h"
#include "platform/json/JSONWriter.h"
#include "platform/queue/QueueThread.h"
#include "util/Gzip.h"

namespace vesk {
namespace {

/// Eight mixed fields, as in the end-to-end bench.
Dictionary payload() {
  return Dictionary{{"msgid", 123456},
                    {"view", "Preferences/Network"},
                    {"username", "someone@example"},
                    {"secret", "do-not-send"},
                    {"duration", 12.75},
                    {"count", 42},
                    {"result", "completed-ok"},
                    {"ratio", 0.3333}};
}

const Dictionary kUserInfo{{kVeskReportingUserInfoClientName, "Bench"},
                           {kVeskReportingUserInfoServiceName, "EndToEnd"}};

/// A backend that creates, filters and holds records as in service, but has nowhere to post them.
std::shared_ptr<VeskReportingBackend> makeBackend(BackendServices& services) {
  Dictionary entry{{"locale_whitelist", List{"US"}},
                   {"sampling_threshold", 1.0},
                   {"expedite", 0},
                   {"filters", List{Dictionary{{"key", "username"}, {"action", "sha256"}},
                                    Dictionary{{"key", "secret"}, {"action", "remove"}}}}};
  auto backend = newBackendWithName(kVeskReportingBackendHTTPPost, Dictionary{{"clients", List{entry}}},
                                    {._compType = 5,
                                     ._productVersion = Text("12.1"),
                                     ._buildVersion = Text("21B91"),
                                     ._hardwareType = Text("Phone7,2"),
                                     ._productFamily = Text("Phone"),
                                     ._requireUserInfo = true,
                                     ._selfVersionMajor = 7},
                                    services);
  backend->setUserInfoDict(kUserInfo);
  backend->setCombinedSessionIDString("q2hyb25vbWV0ZXIgdGVzdA==");
  backend->updateState();
  return backend;
}

class Services {
 public:
  BackendServices services{
      .http = _http,
      .clock = WallClock::system(),
      .counters = _counters,
      .networkQueues = _queues,
      .persistentIdentifierForDNU = [](bool) { return std::string("3E8B9C50-6E5C-4B0E-9D43-0F6B8E5C7A11"); },
      .diagnosticsSubmissionConsent = [] { return true; },
      .regionCode = [] { return std::optional<std::string>("US"); }};

 private:
  HTTPClient _http;
  Counters _counters;
  QueueThread _queues;
};

/// A complete message as sent by a client.
std::string call() {
  std::string message;
  if (appendCall("/o", {"i.f", "m", {payload()}}, message) != CodecResult::Ok) std::abort();
  return message;
}

void readCall(benchmark::State& state) {
  const std::string message = call();
  HeaderParser parser;
  for (auto _ : state) {
    const auto* header = parser.parse(message);
    MessageReader reader({header, 1, std::string_view(message).substr(parser.headerSize()), {}});
    Dictionary dictionary;
    if (!reader.read(dictionary)) std::abort();
    benchmark::DoNotOptimize(dictionary);
  }
}
BENCHMARK(readCall);

void writeCall(benchmark::State& state) {
  const Dictionary message = payload();
  std::string out;
  for (auto _ : state) {
    out.clear();
    benchmark::DoNotOptimize(appendCall("/o", {"i.f", "m", {message}}, out));
  }
}
BENCHMARK(writeCall);

/// Record, user info, filters and the place in the batch, which is discarded every 50 events.
void recordAndFilter(benchmark::State& state) {
  Services shared;
  auto backend = makeBackend(shared.services);
  const Dictionary message = payload();
  timeval now{1'700'000'000, 250'000};
  int held = 0;
  for (auto _ : state) {
    benchmark::DoNotOptimize(backend->sendMessage(message, now, 3, 1, 0));
    if (++held == 50) {
      state.PauseTiming();
      backend->flushMessages();
      held = 0;
      state.ResumeTiming();
    }
  }
}
BENCHMARK(recordAndFilter);

std::string batchOf50() {
  MutableDictionary event(payload());
  for (const char* key : {"_startTS", "_clientVersion", "_eventNumber", "_method", "_status", "_internal"})
    event.set(key, 1700000000);
  for (const char* key : {"_clientTS", "eventTime"}) event.set(key, 1700000000.25);
  for (const char* key :
       {"_sender", "_sessionID", "_productFamily", "_productModel", "_osVersion", "_build"}) {
    event.set(key, "q2hyb25vbWV0");
  }
  JSONWriter writer(JSONStyle::Compact, 1 << 16);
  writer.beginArray();
  for (int i = 0; i < 50; ++i) {
    event.set("msgid", i);
    writer.value(event);
  }
  writer.endArray();
  return writer.finish().value();
}

void jsonOfABatch(benchmark::State& state) {
  for (auto _ : state) benchmark::DoNotOptimize(batchOf50());
  state.SetItemsProcessed(state.iterations() * 50);
}
BENCHMARK(jsonOfABatch);

void gzipOfABatch(benchmark::State& state) {
  const std::string body = batchOf50();
  for (auto _ : state) benchmark::DoNotOptimize(gzipDeflate(body));
  state.SetItemsProcessed(state.iterations() * 50);
}
BENCHMARK(gzipOfABatch);

}  // namespace
}  // namespace vesk

int main(int argc, char** argv) {
  std::string root = std::filesystem::temp_directory_path() / "vesk-bench-XXXXXX";
  if (!::mkdtemp(root.data())) return 1;
  vesk::setRootPrefix(root);
  benchmark::Initialize(&argc, argv);
  benchmark::RunSpecifiedBenchmarks();
  std::filesystem::remove_all(root);
}
