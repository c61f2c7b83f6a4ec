// The dashboard backend: its profile, datagrams to the byte, log lines, log data.
#include <gtest/gtest.h>

#include "backends/DashboardBackend.h"
#include "backends/DashboardText.h"
#include "platform/plist/KeyedArchive.h"
#include "tests/support/BackendHarness.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/DashboardServer.h"
#include "tests/support/RecordingServer.h"
#include "tests/support/SimulatedQueues.h"

namespace vesk::test {
namespace {

constexpr char kUdid[] = "0123456789abcdef0123456789abcdef01234567";
constexpr timeval kWhen{1'700'000'001, 999'999};

class Dashboard : public testing::Test {
 protected:
  BackendServices services() {
    return {_harness.services.http, _harness.clock, _harness.counters, _queues, {}, {}, {}};
  }
  Dictionary profile(Dictionary more = {}) const {
    MutableDictionary entries(
        Dictionary{{"ip", "127.0.0.1"}, {"port", static_cast<int>(_server.endpoint().port)}});
    entries.setAll(more);
    return entries.share();
  }
  std::shared_ptr<VeskReportingBackend> make(const std::optional<Dictionary>& profile) {
    return stamped(
        VeskReportingBackend::newBackendWithName("dashboard", profile, Text("Phone"), 5, _services));
  }
  std::shared_ptr<VeskReportingBackend> stamped(std::shared_ptr<VeskReportingBackend> backend) {
    if (!backend) return nullptr;
    backend->setSelfVersion("7.2");
    backend->setCompType(5);
    backend->setSessionID(0x01020304);
    backend->setClientVersion(0x0506);
    backend->setUdid(kUdid);
    backend->updateState();
    return backend;
  }
  /// The one datagram that a message becomes.
  std::string datagramOf(VeskReportingBackend& backend, const std::optional<Dictionary>& payload) {
    backend.sendMessage(payload, kWhen, 0x0708, 0x090A, 0);
    _queues.queue->run();
    auto datagrams = _server.take();
    return datagrams.size() == 1 ? datagrams[0] : std::to_string(datagrams.size()) + " datagrams";
  }

  DashboardServer _server;
  BackendHarness _harness;
  SimulatedQueues _queues;
  BackendServices _services = services();
  CapturedLog _log;
};

TEST_F(Dashboard, EncodesAMessageToTheByte) {
  auto backend = make(profile());
  ASSERT_TRUE(backend);
  EXPECT_EQ(backend->state(), BackendStateEnabled);
  const auto line = backend->sendMessage(Dictionary{{"b", "xx"}, {"a", "y"}}, kWhen, 0x0708, 0x090A, 0);
  _queues.queue->run();
  const auto datagrams = _server.take();
  ASSERT_EQ(datagrams.size(), 1u);
  using namespace std::string_literals;
  EXPECT_EQ(datagrams[0],
            "\x07\x05\x01\xf9\x65\x53\xf1\x01\xfe\xfd\xfc\xfb\xfa\xf9\xff\xb6\x07\x08\x09\x0a"s + kUdid +
                "\0\x01\0\0 a=y b=xx"s);
  EXPECT_EQ(line, "1700000001.996 "s + kUdid + " 127.0.0.1 HD  1286 16909060     1  1800  2314  a=y b=xx");
}

TEST_F(Dashboard, TellsDeliveryAndOriginInItsFlags) {
  const struct {
    std::shared_ptr<VeskReportingBackend> backend;
    char flags;
  } cases[] = {
      {make(profile()), 0},
      {make(profile(Dictionary{{"reliable", 500}})), 1},
      {stamped(DashboardBackend::create("dashboard", std::string("127.0.0.1"), _server.endpoint().port,
                                        Text("Phone"), _services)),
       3},
  };
  for (const auto& test : cases) {
    ASSERT_TRUE(test.backend);
    const auto datagram = datagramOf(*test.backend, std::nullopt);
    EXPECT_EQ(datagram.size(), 64u);
    EXPECT_EQ(datagram.back(), test.flags);
    EXPECT_EQ(static_cast<unsigned char>(datagram[15]), 0xFF - 64);
  }
  // The profile's other entries.
  EXPECT_EQ(make(profile(Dictionary{{"display_url", "http://d"}}))->displayURL(), "http://d");
}

TEST_F(Dashboard, WritesPayloadsShortestValueFirst) {
  auto backend = make(profile());
  const std::string big(2000, 'x');
  const struct {
    Dictionary payload;
    std::string text;
  } cases[] = {
      {{}, ""},
      {{{"list", List{}}, {"none", Value()}, {"date", Date{1}}}, " list=null none=null date=null"},
      {{{"t", true}, {"i", -12}, {"u", UINT64_MAX}, {"d", 0.25}}, " t=1 i=-12 d=0.25 u=18446744073709551615"},
      {{{"empty", ""}, {"lines", "\n\n"}}, " empty=empty lines=empty"},
      {{{"x", "a=b"}, {"y", "\\=\n\\\\"}}, " x=a\\=b y=\\\\\\=\\\\\\\\"},
      {{{"k=1 2", "v"}}, " k=1 2=v"},
      // Two UTF-16 units, though one character; and one unit, though three bytes.
      {{{"party", "🎉"}, {"arrow", "→"}, {"a", "abc"}}, " arrow=→ party=🎉 a=abc"},
      {{{"big", big}, {"more", big}}, " big=" + big.substr(0, 1018)},
      {{{"k", std::string(1018, 'x')}, {"next", big}}, " k=" + std::string(1018, 'x') + " n"},
  };
  for (const auto& test : cases) {
    const auto datagram = datagramOf(*backend, test.payload);
    EXPECT_EQ(datagram.substr(64), test.text);
    EXPECT_EQ(decodeDashboardHeader(datagram)->length, 64 + test.text.size());
  }
}

TEST_F(Dashboard, ACutCharacterCostsTheLineOnly) {
  auto backend = make(profile());
  const Dictionary payload{{"k", std::string(1019, 'x') + "ä"}};
  EXPECT_EQ(backend->sendMessage(payload, kWhen, 1, 2, 0), std::nullopt);
  _queues.queue->run();
  const auto datagrams = _server.take();
  ASSERT_EQ(datagrams.size(), 1u);
  EXPECT_EQ(datagrams[0].size(), 1087u);
  EXPECT_EQ(datagrams[0].back(), '\xc3');
}

TEST_F(Dashboard, LinesStandInForWhatIsMissing) {
  auto backend = make(profile());
  backend->setCompType(12);
  backend->setUdid("short");
  const auto line = backend->sendMessage(std::nullopt, {0, 0}, 0, 0, 0);
  EXPECT_EQ(line, "0.000 short 127.0.0.1 -  1286 16909060     1     0     0 ");
}

struct ProfileCase {
  const char* description;
  std::optional<Dictionary> profile;
  const char* line;
};

TEST_F(Dashboard, RefusesProfilesThatNameNoServer) {
  const char* const noIP = "DashboardBackend(initWithName): can't resolve server IP";
  const char* const noPort = "DashboardBackend(initWithName): can't resolve server port";
  const char* const unreachable = "DashboardBackend(initWithName): socket connect() failed.";
  const ProfileCase cases[] = {
      {"no profile", std::nullopt, "DashboardBackend(initWithName): initWitName with all null params."},
      {"no ip", Dictionary{{"port", 1}}, noIP},
      {"ip of a wrong type", Dictionary{{"ip", 1}, {"port", 1}}, noIP},
      {"ip too long", Dictionary{{"ip", "255.255.255.2555"}, {"port", 1}}, unreachable},
      {"ip is a name", Dictionary{{"ip", "localhost"}, {"port", 1}}, unreachable},
      {"no port", Dictionary{{"ip", "127.0.0.1"}}, noPort},
      {"a server that nobody may send to", Dictionary{{"ip", "255.255.255.255"}, {"port", 1}}, unreachable},
      {"reliable, to the same", Dictionary{{"ip", "255.255.255.255"}, {"port", 1}, {"reliable", 1}},
       unreachable},
  };
  const long before = openDescriptors();
  for (const auto& test : cases) {
    SCOPED_TRACE(test.description);
    _log.clear();
    EXPECT_FALSE(make(test.profile));
    EXPECT_EQ(_log.count(3, test.line), 1);
    EXPECT_EQ(_log.countContaining(3, ""), 1) << "one line of level 3";
    _queues.queue->run();
    EXPECT_EQ(openDescriptors(), before);
    EXPECT_EQ(_queues.queue->waiting() + _queues.queue->readers(), 0u);
  }
  EXPECT_FALSE(
      DashboardBackend::create("dashboard", std::optional<std::string>(), 1, Text("Phone"), _services));
}

TEST_F(Dashboard, TakesTheTickFromItsProfile) {
  const struct {
    Value reliable;
    int tick;
    bool warns;
  } cases[] = {{500, 500, false}, {"40", 40, false}, {true, 1, false},    {86'400'000, 86'400'000, false},
               {0, 500, true},    {-3, 500, true},   {"soon", 500, true}, {UINT64_MAX, 500, true}};
  for (const auto& test : cases) {
    SCOPED_TRACE(describe(test.reliable));
    _log.clear();
    auto backend = make(profile(Dictionary{{"reliable", test.reliable}}));
    _queues.queue->run();
    EXPECT_EQ(datagramOf(*backend, std::nullopt).back(), 1);
    _queues.queue->advance(std::chrono::milliseconds(2 * test.tick - 1));
    EXPECT_EQ(_server.take().size(), 0u);
    _queues.queue->advance(std::chrono::milliseconds(1));
    EXPECT_EQ(_server.take().size(), 1u);
    EXPECT_EQ(_log.countContaining(4, ""), test.warns);
    backend->cleanup();
    _queues.queue->advance(std::chrono::hours(48));
    _server.take();
  }
  auto backend = make(profile(Dictionary{{"reliable", INT64_MAX}}));
  _queues.queue->run();
  datagramOf(*backend, std::nullopt);
  _queues.queue->advance(std::chrono::years(50));
  EXPECT_TRUE(_server.take().empty()) << "as long as the clock can hold";
}

TEST_F(Dashboard, GoesWithItsSessionEvenWithoutCleanup) {
  const long before = openDescriptors();
  for (bool hasMemory : {true, false}) {
    auto backend = make(profile(Dictionary{{"reliable", 10}}));
    _queues.queue->refusesWork = !hasMemory;
    backend.reset();
    _queues.queue->refusesWork = false;
    _queues.queue->run();
    EXPECT_EQ(openDescriptors(), before);
  }
}

TEST_F(Dashboard, AnnouncesWhereLogDataWent) {
  const List logData{Dictionary{{"when", Date{12.5}}, {"text", "ä"}}, Bytes("\x01")};
  const struct {
    unsigned status;
    const char* answer;
    const char* text;  // of the announcement; null: none
    const char* problem;
  } cases[] = {
      {200, "http://d/7?a=b", " LogDataUploadLocation=http://d/7?a\\=b", nullptr},
      {404, "not here", " LogDataUploadLocation=not here", nullptr},
      {200, "", nullptr, "(null)"},
      {200, "\xff", nullptr, "the answer is not UTF-8"},
  };
  for (const auto& test : cases) {
    SCOPED_TRACE(test.answer);
    RecordingServer server([&](const HTTPReceived&, std::size_t) {
      HTTPAnswer answer;
      answer.status = test.status;
      answer.body = test.answer;
      return answer;
    });
    auto backend = make(profile(Dictionary{{"post_url", server.url("/log?x")}}));
    EXPECT_EQ(backend->uploadLogData(logData), test.text != nullptr);
    _queues.queue->run();
    const auto datagrams = _server.take();
    ASSERT_EQ(datagrams.size(), test.text ? 1u : 0u);
    if (test.text) {
      EXPECT_EQ(datagrams[0].substr(64), test.text);
      const auto header = decodeDashboardHeader(datagrams[0]);
      EXPECT_EQ(header->method, 0);
      EXPECT_EQ(header->respCode, 2);
      EXPECT_EQ(
          _log.count(7, std::string("DashboardBackend(uploadLogData): Log data uploaded to ") + test.answer),
          1);
    } else {
      EXPECT_EQ(
          _log.count(3, std::string("DashboardBackend(uploadLogData): Error uploading log data array (") +
                            test.problem + ")"),
          1);
    }
    const auto request = server.requests().at(0);
    EXPECT_EQ(request.method, "POST");
    EXPECT_EQ(request.target, "/log?x");
    EXPECT_EQ(request.header("Content-Type"), "application/octet-stream");
    EXPECT_EQ(unarchiveValue(request.body).value, Value(logData));
  }
}

TEST_F(Dashboard, RefusesLogDataThatCanNotGo) {
  EXPECT_FALSE(make(profile())->uploadLogData(List{1}));
  EXPECT_EQ(_log.count(3, "DashboardBackend(uploadLogData): Post URL for log data array is nil"), 1);
  auto backend = make(profile(Dictionary{{"post_url", "http://127.0.0.1:1/"}}));
  EXPECT_FALSE(backend->uploadLogData(List{"\xff"}));
  EXPECT_EQ(_log.count(3, "DashboardBackend(uploadLogData): Failed to serialize log data array for upload"),
            1);
  EXPECT_FALSE(backend->uploadLogData(List{1}));
  EXPECT_EQ(_log.countContaining(3, "DashboardBackend(uploadLogData): Error uploading log data array ("), 1);
  EXPECT_FALSE(make(profile(Dictionary{{"post_url", "nowhere"}}))->uploadLogData(List{1}));
  _services.uploads =
      std::make_shared<UploadGate>(UploadGate::Limits{.uploads = 0, .bytes = 0, .patience = {}});
  EXPECT_FALSE(backend->uploadLogData(List{1}));
  EXPECT_EQ(_log.count(3,
                       "DashboardBackend(uploadLogData): Error uploading log data array "
                       "(too many uploads are under way)"),
            1);
  _queues.queue->run();
  EXPECT_TRUE(_server.take().empty());
}

}  // namespace
}  // namespace vesk::test
