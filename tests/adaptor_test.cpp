// The adaptor backend with adaptors that are really loaded: the example and faulty ones.
#include <VeskReporting/WrenAdaptor.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cmath>
#include <filesystem>
#include <future>

#include "backends/BackendFactory.h"
#include "backends/wren/WrenBackend.h"
#include "platform/files/RootPrefix.h"
#include "tests/support/BackendHarness.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/DaemonHarness.h"
#include "tests/support/TempDirectory.h"
#include "util/SamplingDraw.h"

namespace vesk::test {
namespace {

namespace fs = std::filesystem;

constexpr char kLibrary[] =
    "System/Library/PrivateFrameworks/ZelkoServices.framework/Frameworks/ZKSPerformance.framework/"
    "ZKSPerformance.so";

using Line = std::pair<int, std::string>;

void install(const fs::path& root, const fs::path& library) {
  fs::create_directories((root / kLibrary).parent_path());
  fs::copy_file(library, root / kLibrary, fs::copy_options::overwrite_existing);
}

std::string missing(const char* adaptor) {
  return std::string("WrenBackend(sendMessage): Wren adaptor ") + adaptor +
         " does not respond to forwarding selector sendMessageWithMethod:respCode:dict:";
}

class AdaptorTest : public testing::Test {
 protected:
  AdaptorTest() {
    setRootPrefix(directory.path().string());
    fs::create_directories(directory / "var/lib/veskreportingd");
  }
  ~AdaptorTest() override { setRootPrefix(""); }

  std::shared_ptr<VeskReportingBackend> make(std::int32_t clientType = 7) {
    return newBackendWithName("wren", std::nullopt, {._compType = clientType}, harness.services);
  }
  void send(VeskReportingBackend& backend, const std::optional<Dictionary>& payload,
            std::uint16_t method = 3) {
    EXPECT_EQ(backend.sendMessage(payload, timeval{}, method, 4, 0), std::nullopt);
  }

  TempDirectory directory;
  BackendHarness harness;
  CapturedLog log;
};

TEST_F(AdaptorTest, OnlyTwoClientTypesHaveOne) {
  const std::string unit = "WrenBackend(initWithName): ";
  for (std::int32_t type : {1, 6, 7, 8, 10, 11, 12, -7, 1 << 30, 0}) {
    log.clear();
    const bool has = type == 7 || type == 11;
    EXPECT_EQ(make(type) != nullptr, has) << type;
    std::vector<Line> lines = log.lines();
    if (has) lines.resize(1);
    std::vector<Line> expected{
        {6, unit + "Loading Wren adaptor class for client type " + std::to_string(type)},
        {3, unit + "No matching bundle found for client type " + std::to_string(type)}};
    if (has) expected.pop_back();
    EXPECT_EQ(lines, expected);
  }
  ::srand48(1);
  nextSamplingDraw();
  const double second = nextSamplingDraw();
  ::srand48(1);
  EXPECT_FALSE(make(8));
  EXPECT_EQ(make()->samplingFactor(), second) << "the refused one took the first";
}

TEST_F(AdaptorTest, WhatIsOfNoUseCostsALineForEachMessage) {
  const std::string failed = "WrenBackend(sendMessage): Wren adaptor Bad failed: ";
  const std::string init = "WrenBackend(initWithName): ";
  const std::string none = missing("(null)");
  // The library, the line logged when it is loaded ("@": its path), the line for a message, and the line for
  // a message of type 1.
  using Case = std::tuple<const char*, int, std::string, std::string, std::string>;
  const Case cases[] = {
      {nullptr, 7, "@: cannot open shared object file: No such file or directory", none, none},
      {"/etc/passwd", 7, "@: invalid ELF header", none, none},
      {VESK_WITHOUT_FACTORY, 7, "@ exports no WrenAdaptor", none, none},
      {VESK_OTHER_VERSION, 7, "@ is made for version 2", none, none},
      {VESK_THROWING_FACTORY, 3, "Wren adaptor could not be made: no antenna", none, none},
      {VESK_WITHOUT_OPERATIONS, 0, "", none, none},
      {VESK_WITHOUT_OPERATION, 0, "", missing("Bad"), missing("Bad")},
      {VESK_THROWING_OPERATION, 0, "", failed + "out of order", failed + "an exception of its own"},
  };
  std::uint64_t number = 0;
  for (auto [library, level, line, sent, sentWithType1] : cases) {
    SCOPED_TRACE(library ? library : "none");
    // Each case uses its own path, since a library stays loaded.
    const fs::path root = directory / std::to_string(++number);
    fs::create_directories(root);
    setRootPrefix(root.string());
    if (library) install(root, library);
    log.clear();
    auto backend = make();
    ASSERT_TRUE(backend);
    send(*backend, Dictionary{{"k", 1}});
    backend->sendMessage(Dictionary(), timeval{}, 3, 1, 0);
    backend.reset();
    std::vector<Line> expected{{6, init + "Loading Wren adaptor class for client type 7"}};
    if (line.starts_with('@')) line.replace(0, 1, (root / kLibrary).string());
    if (level > 0) expected.push_back({level, init + line});
    expected.insert(expected.end(), {{3, sent}, {3, sentWithType1}});
    if (sent.find("Bad") != std::string::npos) {
      expected.push_back({3, "WrenBackend(dealloc): Wren adaptor failed: an exception of its own"});
    }
    std::vector<Line> lines = log.lines();
    std::erase_if(lines, [](const Line& each) { return each.second.starts_with("WrenAdaptor: "); });
    EXPECT_EQ(lines, expected);
    EXPECT_EQ(harness.dropped(DropReason::AdaptorFailed), 2 * number);
  }
  EXPECT_EQ(harness.counters.snapshot().at(0).backend, "wren");
}

TEST_F(AdaptorTest, WritesToTheLogWithALevelOfItsOwn) {
  install(directory.path(), VESK_WITHOUT_OPERATION);
  auto backend = make();
  std::vector<int> levels;
  for (const auto& [level, line] : log.lines()) {
    if (line == "WrenAdaptor: made") levels.push_back(level);
  }
  EXPECT_EQ(levels, (std::vector<int>{3, 4, 6, 7, 7, 7}));
  EXPECT_EQ(log.lines().back(), Line(6, "WrenAdaptor: "));
}

TEST_F(AdaptorTest, OneThatHangsHoldsUpNothingButMessages) {
  install(directory.path(), VESK_HANGING_OPERATION);
  const std::string pipe = directory / "var/lib/veskreportingd/pipe";
  ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
  auto backend = make();
  auto sent = std::async(std::launch::async, [&] { send(*backend, Dictionary()); });
  FileDescriptor end(::open(pipe.c_str(), O_WRONLY));  // waits until the adaptor runs
  auto set = std::async(std::launch::async, [&] { backend->setCorrelatedSessionID("combined"); });
  EXPECT_EQ(set.wait_for(std::chrono::seconds(30)), std::future_status::ready);
  end.reset();
  sent.get();
  EXPECT_EQ(backend->combinedSessionIDString(), "combined");
}

TEST_F(AdaptorTest, TheExampleWritesEveryKindOfValue) {
  install(directory.path(), VESK_EXAMPLE_ADAPTOR);
  auto first = make(7);
  auto second = make(11);
  const Dictionary nested{{"list", List{1, "a\"\n", Value(), List{}}}, {"none", Dictionary{}}};
  send(*first,
       Dictionary{{"on", true},
                  {"signed", -5},
                  {"unsigned", UINT64_MAX},
                  {"real", 0.5},
                  {"infinite", HUGE_VAL},
                  {"date", Date{12}},
                  {"bytes", Bytes("x")},
                  {"nested", nested}},
       65535);
  send(*second, Dictionary(), 0);
  send(*first, std::nullopt, 1);
  EXPECT_EQ(directory.read("var/lib/veskreportingd/wren.jsonl"),
            R"({"method":65535,"respCode":4,"dict":{"on":true,"signed":-5,"unsigned":18446744073709551615,)"
            R"("real":0.5,"infinite":null,"date":12,"bytes":null,)"
            R"("nested":{"list":[1,"a\"\u000a",null,[]],"none":{}}}})"
            "\n"
            R"({"method":0,"respCode":4,"dict":{}})"
            "\n"
            R"({"method":1,"respCode":4,"dict":{}})"
            "\n");
}

TEST(AdaptorRoad, TheDaemonLoadsItInItsSandbox) {
  DaemonHarness harness;
  harness.writeStorebag("palvo", "version = \"1\"\n[release.wren]\n");
  install(harness.root.path(), VESK_EXAMPLE_ADAPTOR);
  harness.startDaemon();
  {
    RoadClient client(harness, Dictionary{{kVeskReportingSessionInfoClientType, 7}});
    EXPECT_EQ(client.enabled, BackendNames{"wren"});
    EXPECT_TRUE(client.reporting.sendMessageAndWait(5, 7, Dictionary{{"k", "v"}}));
    EXPECT_NE(harness.root.read("var/lib/veskreportingd/wren.jsonl")
                  .find(R"({"method":5,"respCode":7,"dict":{"k":"v"}})"),
              std::string::npos);
  }
  EXPECT_EQ(harness.stopDaemon(), 0);
}

}  // namespace
}  // namespace vesk::test
