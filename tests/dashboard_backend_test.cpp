// The dashboard backend: its profile, datagrams byte by byte, log lines, log data.
#include <gtest/gtest.h>

#include "backends/BackendFactory.h"
#include "backends/dashboard/DashboardBackend.h"
#include "backends/dashboard/DashboardText.h"
#include "tests/support/BackendHarness.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/DashboardServer.h"
#include "tests/support/RecordingServer.h"
#include "tests/support/ScarceMemory.h"
#include "tests/support/SimulatedQueues.h"
#include "tests/support/SocketFaults.h"
#include "tools/plist/KeyedArchiveReader.h"

namespace vesk::test {
namespace {

using namespace std::string_literals;

constexpr char kUdid[] = "0123456789abcdef0123456789abcdef01234567";
constexpr timeval kWhen{1'700'000'001, 999'999};

class Dashboard : public testing::Test {
 protected:
  Dictionary profile(Dictionary more = {}) const {
    MutableDictionary entries(
        Dictionary{{"ip", "127.0.0.1"}, {"port", static_cast<int>(_server.endpoint().port)}});
    entries.setAll(more);
    return entries.share();
  }
  std::shared_ptr<VeskReportingBackend> make(const std::optional<Dictionary>& profile) {
    return make(profile, identity());
  }
  std::shared_ptr<VeskReportingBackend> make(const std::optional<Dictionary>& profile,
                                             const BackendIdentity& identity) {
    auto backend = newBackendWithName("dashboard", profile, identity, _services);
    if (backend) backend->updateState();
    return backend;
  }
  static BackendIdentity identity() {
    return {._sessionID = 0x01020304,
            ._compType = 5,
            ._clientVersion = 0x0506,
            ._udid = kUdid,
            ._selfVersionMajor = 7};
  }
  /// The datagram of a message.
  std::string datagramOf(VeskReportingBackend& backend, const std::optional<Dictionary>& payload) {
    backend.sendMessage(payload, kWhen, 0x0708, 0x090A, 0);
    _queues.queue->run();
    auto datagrams = _server.take();
    return datagrams.size() == 1 ? datagrams[0] : std::to_string(datagrams.size()) + " datagrams";
  }

  DashboardServer _server;
  BackendHarness _harness;
  SimulatedQueues _queues;
  BackendServices _services{.http = _harness.services.http,
                            .clock = _harness.clock,
                            .counters = _harness.counters,
                            .networkQueues = _queues};
  CapturedLog _log;
};

TEST_F(Dashboard, EncodesAMessageToTheByte) {
  auto backend = make(profile());
  ASSERT_TRUE(backend);
  EXPECT_EQ(backend->state(), BackendStateEnabled);
  const auto line = backend->sendMessage(Dictionary{{"b", "xx"}, {"a", "y"}}, kWhen, 0x0708, 0x090A, 0);
  _queues.queue->run();
  EXPECT_EQ(_server.take(),
            std::vector{"\x07\x05\x01\xf9\x65\x53\xf1\x01\xfe\xfd\xfc\xfb\xfa\xf9\xff\xb6\x07\x08\x09\x0a"s +
                        kUdid + "\0\x01\0\0 a=y b=xx"s});
  EXPECT_EQ(line, "1700000001.996 "s + kUdid + " 127.0.0.1 HD  1286 16909060     1  1800  2314  a=y b=xx");
}

TEST_F(Dashboard, HeadersCarryWhatFitsIntoThem) {
  auto carries = [this](timeval when, std::int32_t clientType, std::uint32_t session, std::uint16_t version,
                        std::string udid, const std::string& first, const std::string& line) {
    SCOPED_TRACE(line);
    auto backend = make(profile(), {._sessionID = session,
                                    ._compType = clientType,
                                    ._clientVersion = version,
                                    ._udid = udid,
                                    ._selfVersionMajor = 7});
    EXPECT_EQ(backend->sendMessage(std::nullopt, when, 0, 0xFFFF, 3), line + "     1     0 65535 ");
    _queues.queue->run();
    udid.resize(40);
    EXPECT_EQ(_server.take(), std::vector{first + "\xFF\xBF"s + "\0\0\xFF\xFF"s + udid + "\0\1\0\0"s});
  };
  carries({0, 0}, 0, 0, 0, "", "\7\0\1\0\0\0\0\0\xFF\xFF\xFF\xFF\xFF\xFF"s,
          "0.000  127.0.0.1 QX     0     0");
  carries({0x1'8000'0002, 3999}, 12, 0, 0, "", "\7\x0C\1\0\x80\0\0\2\xFF\xFF\xFF\xFF\xFF\xFF"s,
          "2147483650.000  127.0.0.1 -     0     0");
  carries({1, 4000}, -1, 0, 0, "short", "\7\xFF\1\1\0\0\0\1\xFF\xFF\xFF\xFF\xFF\xFF"s,
          "1.004 short 127.0.0.1 -     0     0");
  carries({-1, 7999}, 0x705, UINT32_MAX, UINT16_MAX, kUdid + "89"s, "\7\5\1\1\xFF\xFF\xFF\xFF\0\0\0\0\0\0"s,
          "4294967295.004 "s + kUdid + " 127.0.0.1 HD 65535 4294967295");
}

TEST_F(Dashboard, NumbersItsMessagesAndNamesTheirSenders) {
  auto sender = identity();
  sender.setSelfVersion("263.1");
  sender._compType = 0;
  for (const char* code : {"QX", "WB", "JYP", "KF", "UZ", "HD", "EP", "YW", "BQ", "FX", "DJ", "OZ", "-"}) {
    const std::string line = make(profile(), sender)->sendMessage(std::nullopt, kWhen, 0, 0, 0).value();
    EXPECT_NE(line.find(" 127.0.0.1 "s + code + "  1286 "), std::string::npos) << line;
    ++sender._compType;
  }
  auto backend = make(profile(), sender);
  for (int i = 1; i < 0x1234; ++i) backend->sendMessage(std::nullopt, kWhen, 0, 0, 0);
  _queues.queue->run();
  _server.take();
  const auto datagram = datagramOf(*backend, std::nullopt);
  EXPECT_EQ(datagram.substr(60, 2), "\x12\x34");
  EXPECT_EQ(datagram[0], 7);
}

TEST_F(Dashboard, TellsDeliveryAndOriginInItsFlags) {
  const Dictionary reliable{{"reliable", 500}};
  const std::tuple<std::optional<Dictionary>, int, char> cases[] = {
      {profile(), 0, 0},    {profile(reliable), 0, 1},     {profile(reliable), EADDRINUSE, 0},
      {std::nullopt, 0, 3}, {std::nullopt, EADDRINUSE, 2},
  };
  for (const auto& [profile, bindError, flags] : cases) {
    SocketFaults::bindError = bindError;
    auto backend = profile ? make(profile)
                           : DashboardBackend::create("dashboard", std::string("127.0.0.1"),
                                                      _server.endpoint().port, identity(), _services);
    SocketFaults::bindError = 0;
    ASSERT_TRUE(backend);
    _queues.queue->run();
    EXPECT_EQ(datagramOf(*backend, std::nullopt).substr(62), (std::string{'\0', flags}));
    EXPECT_EQ(backend->displayURL(), std::nullopt);
    _queues.queue->advance(std::chrono::milliseconds(999));
    EXPECT_EQ(_server.take().size(), 0u);
    _queues.queue->advance(std::chrono::milliseconds(1));
    EXPECT_EQ(_server.take().size(), flags % 2 == 1 ? 1u : 0u) << "sent again at the second tick";
    backend.reset();
    _queues.queue->advance(std::chrono::seconds(20));
    _server.take();
  }
  EXPECT_EQ(make(profile(Dictionary{{"display_url", "http://d"}}))->displayURL(), "http://d");
}

TEST_F(Dashboard, FindsItsServerByAnyNumber) {
  const int port = _server.endpoint().port;
  const std::string text = std::to_string(port);
  for (const Value& value : {Value(port), Value(static_cast<std::uint64_t>(port)), Value(port + 0.75),
                             Value(port + 65536), Value(port - 65536), Value(text), Value("+" + text),
                             Value(" " + text + "th"), Value(std::to_string(port + 3 * 65536))}) {
    SCOPED_TRACE(describe(value));
    auto backend = make(Dictionary{{"ip", "127.0.0.1"}, {"port", value}});
    ASSERT_TRUE(backend);
    EXPECT_EQ(datagramOf(*backend, std::nullopt).size(), 64u);
  }
}

TEST_F(Dashboard, WritesPayloadsShortestValueFirst) {
  auto backend = make(profile());
  const std::string big(2000, 'x');
  const std::pair<std::optional<Dictionary>, std::string> cases[] = {
      {std::nullopt, ""},
      {Dictionary{}, ""},
      {Dictionary{{"list", List{"a"}}, {"none", Value()}, {"date", Date{1}}, {"bytes", Bytes("b")}},
       " list=null none=null date=null bytes=null"},
      {Dictionary{{"dictionary", Dictionary{{"a", 1}}}}, " dictionary=null"},
      {Dictionary{{"t", true}, {"f", false}, {"i", -12}, {"u", UINT64_MAX}, {"d", 0.25}, {"b", 1e20}},
       " t=1 f=0 i=-12 d=0.25 b=1e+20 u=18446744073709551615"},
      {Dictionary{{"empty", ""}, {"line", "\n"}, {"lines", "\n\n"}}, " empty=empty line=empty lines=empty"},
      {Dictionary{{"x", "a=b"}, {"y", "\\=\n\\\\"}}, " x=a\\=b y=\\\\\\=\\\\\\\\"},
      {Dictionary{{"x", "==\r\t a"}, {"y", "1\n2\n"}}, " y=12 x=\\=\\=\r\t a"},
      {Dictionary{{"k=1\n\\ 2", "v"}, {"", "w"}}, " k=1\n\\ 2=v =w"},
      // One character of two UTF-16 units, and characters of one unit but two or three bytes.
      {Dictionary{{"party", "🎉"}, {"arrow", "→"}, {"u", "üü"}, {"a", "abc"}}, " arrow=→ party=🎉 u=üü a=abc"},
      // Values are ordered by their length before sanitising, including "null".
      {Dictionary{{"none", Value()}, {"e", ""}, {"x", "===="}, {"abc", "abc"}},
       " e=empty abc=abc none=null x=\\=\\=\\=\\="},
      {Dictionary{{"big", big}, {"more", big}}, " big=" + big.substr(0, 1018)},
      {Dictionary{{"k", std::string(1018, 'x')}, {"next", big}}, " k=" + std::string(1018, 'x') + " n"},
      {Dictionary{{"k", std::string(1020, 'x')}, {"next", big}}, " k=" + std::string(1020, 'x')},
      {Dictionary{{"k", std::string(1021, 'x')}}, " k=" + std::string(1020, 'x')}};
  for (const auto& [payload, text] : cases) {
    const auto datagram = datagramOf(*backend, payload);
    EXPECT_EQ(datagram.substr(64), text);
    EXPECT_EQ(decodeDashboardHeader(datagram)->length, 64 + text.size());
  }
  EXPECT_EQ(descriptionForObject(std::nullopt), "null");
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

TEST_F(Dashboard, SaysWhatItDoesInTheSystemLog) {
  using Lines = std::vector<std::pair<int, std::string>>;
  const std::string start = "DashboardBackend(initWithName): ",
                    type = "dashboard: The storebag's value for '",
                    absent = "' has the wrong type and counts as absent: ",
                    upload = "DashboardBackend(uploadLogData): ";
  const std::pair<int, std::string> noIP{3, start + "can't resolve server IP"},
      noPort{3, start + "can't resolve server port"}, unreachable{3, start + "socket connect() failed."},
      noTimer{3, start + "can't create timer source."};
  auto refuses = [this](const std::optional<Dictionary>& profile) {
    return [this, profile] {
      const long before = openDescriptors();
      EXPECT_FALSE(make(profile));
      _queues.queue->run();
      EXPECT_EQ(openDescriptors(), before);
      EXPECT_EQ(_queues.queue->waiting() + _queues.queue->readers(), 0u);
    };
  };
  auto takes = [this](const Dictionary& more) {
    return [this, more] {
      const long before = openDescriptors();
      EXPECT_TRUE(make(profile(more)));
      _queues.queue->run();
      EXPECT_EQ(openDescriptors(), before) << "it goes without cleanup, too";
    };
  };
  auto with = [](auto& fault, auto value, auto act) {
    return [&fault, value, act] {
      const auto usual = std::exchange(fault, value);
      act();
      fault = usual;
    };
  };
  auto at = [](const char* ip, Value port, Value reliable) {
    return Dictionary{{"ip", ip}, {"port", port}, {"reliable", reliable}};
  };
  const Dictionary reliable{{"reliable", 500}};
  const std::tuple<const char*, std::function<void()>, Lines> cases[] = {
      {"no profile", refuses(std::nullopt), {{3, start + "initWitName with all null params."}}},
      {"nothing in it", refuses(Dictionary{}), {noIP}},
      {"no ip", refuses(Dictionary{{"port", 1}}), {noIP}},
      {"no port", refuses(Dictionary{{"ip", "127.0.0.1"}}), {noPort}},
      {"ip of a wrong type", refuses(Dictionary{{"ip", 1}}), {{4, type + "ip" + absent + "1"}, noIP}},
      {"port of a wrong type",
       refuses(at("127.0.0.1", List{}, 1)),
       {{4, type + "port" + absent + "[]"}, noPort}},
      {"reliable of a wrong type",
       takes(Dictionary{{"reliable", List{}}}),
       {{4, type + "reliable" + absent + "[]"}}},
      {"ip is a name", refuses(at("localhost", 1, 1)), {unreachable}},
      {"ip with a NUL",
       refuses(Dictionary{{"ip", Text(std::string_view("127.0.0.1\0", 10))}, {"port", 1}}),
       {unreachable}},
      {"ip is for all", refuses(at("255.255.255.255", 1, 1)), {unreachable}},
      {"reliable is 0",
       takes(Dictionary{{"reliable", 0}}),
       {{4, start + "'reliable' can't be 0 ms, using 500 ms"}}},
      {"reliable longer than anything lives", takes(Dictionary{{"reliable", INT64_MAX}}), {}},
      {"no socket",
       with(SocketFaults::socketError, EMFILE, refuses(profile())),
       {{3, start + "socket() failed (24)"}}},
      {"no port of its own",
       with(SocketFaults::bindError, EADDRINUSE, takes(reliable)),
       {{3, "DashboardBackend(useReliableUDP): can't bind socket, 98"}}},
      {"no read source",
       with(_queues.queue->refusesReadSources, true, takes(reliable)),
       {{3, "DashboardBackend(useReliableUDP): can't create read source"}}},
      {"no queue", with(_queues.refusesQueues, true, refuses(profile(reliable))), {noTimer}},
      {"no timer",
       with(_queues.queue->refusesWork, true, [&] { EXPECT_FALSE(make(profile(reliable))); }),
       {noTimer}},
#if !defined(__SANITIZE_THREAD__) && !defined(__SANITIZE_ADDRESS__)  // these builds allocate earlier
      {"no buffer",
       [&] {
         auto backend = make(profile());
         ScarceMemory scarce;
         EXPECT_EQ(backend->sendMessage(std::nullopt, kWhen, 0, 0, 0), std::nullopt);
       },
       {{3, "DashboardBackend(sendMessage): can't malloc."}}},
#endif
      {"cleanup, answered late, twice",
       [&] {
         auto backend = make(profile(reliable));
         _queues.queue->run();
         datagramOf(*backend, std::nullopt);
         backend->cleanup();
         backend->cleanup();
         _queues.queue->advance(std::chrono::milliseconds(1500));
         _server.acknowledge(1);
         _queues.queue->advance(std::chrono::milliseconds(500));
         backend->cleanup();
         _queues.queue->advance(std::chrono::milliseconds(30'000));
         _server.take();
       },
       {{7, "DashboardBackend(myPeriodicTask): scheduled last resort clean-up in 9500 ms."},
        {7, "DashboardBackend(myPeriodicTask): clean up at myPeriodicTask."}}},
      {"no post_url",
       [&] { EXPECT_FALSE(make(profile())->uploadLogData(List{1})); },
       {{3, upload + "Post URL for log data array is nil"}}},
  };
  for (const auto& [description, act, lines] : cases) {
    SCOPED_TRACE(description);
    _log.clear();
    act();
    EXPECT_EQ(_log.lines(), lines);
  }
  _log.clear();
  EXPECT_FALSE(DashboardBackend::create("dashboard", std::optional<std::string>(), 1, identity(), _services));
  EXPECT_EQ(_log.lines(), Lines{});
}

TEST_F(Dashboard, TakesTheTickFromItsProfile) {
  const std::tuple<Value, int, bool> cases[] = {
      {500, 500, false}, {"40", 40, false}, {true, 1, false},    {86'400'000, 86'400'000, false},
      {0, 500, true},    {-3, 500, true},   {"soon", 500, true}, {UINT64_MAX, 500, true}};
  for (const auto& [reliable, tick, warns] : cases) {
    SCOPED_TRACE(describe(reliable));
    _log.clear();
    auto backend = make(profile(Dictionary{{"reliable", reliable}}));
    _queues.queue->run();
    EXPECT_EQ(datagramOf(*backend, std::nullopt).back(), 1);
    _queues.queue->advance(std::chrono::milliseconds(2 * tick - 1));
    EXPECT_EQ(_server.take().size(), 0u);
    _queues.queue->advance(std::chrono::milliseconds(1));
    EXPECT_EQ(_server.take().size(), 1u);
    EXPECT_EQ(_log.countContaining(4, ""), warns);
    backend->cleanup();
    _queues.queue->advance(std::chrono::hours(48));
    _server.take();
  }
}

TEST_F(Dashboard, UploadsLogDataAndAnnouncesWhereItWent) {
  const std::string upload = "DashboardBackend(uploadLogData): ";
  const std::string failed = upload + "Error uploading log data array (";
  const List logData{Dictionary{{"when", Date{12.5}}, {"text", "ä"}}, Bytes("\x01")};
  // text: of the message with the location; null: none
  const std::tuple<unsigned, std::string, const char*, std::string> cases[] = {
      {200, "http://d/7?a=b", " LogDataUploadLocation=http://d/7?a\\=b",
       "Log data uploaded to http://d/7?a=b"},
      {404, "not here", " LogDataUploadLocation=not here", "Log data uploaded to not here"},
      {503, "ü", " LogDataUploadLocation=ü", "Log data uploaded to ü"},
      {200, "", nullptr, "Error uploading log data array ((null))"},
      {200, "\xFF", nullptr, "Error uploading log data array (the answer is not UTF-8)"},
      {200, "a\0b"s, nullptr, "Error uploading log data array (the answer is not UTF-8)"}};
  RecordingServer server;
  auto backend = make(profile(Dictionary{{"post_url", server.url("/log?x")}}));
  _harness.clock.set(1'234.5);
  for (std::uint16_t event = 0; const auto& [status, body, text, line] : cases) {
    SCOPED_TRACE(line);
    HTTPAnswer answer;
    answer.status = status;
    answer.body = body;
    server.answerWith(answer);
    _log.clear();
    EXPECT_EQ(backend->uploadLogData(logData), text != nullptr);
    EXPECT_EQ(_log.lines(), std::vector{std::pair(text ? 7 : 3, upload + line)});
    _queues.queue->run();
    const auto datagrams = _server.take();
    ASSERT_EQ(datagrams.size(), text ? 1u : 0u);
    if (text) {
      EXPECT_EQ(datagrams[0].substr(64), text);
      const auto header = decodeDashboardHeader(datagrams[0]);
      EXPECT_EQ(header->method, 0);
      EXPECT_EQ(header->respCode, 2);
      EXPECT_EQ(header->eventID, ++event);
      EXPECT_EQ(header->seconds, 1'234u);
      EXPECT_EQ(header->milliseconds(), 500u);
    }
    const auto request = server.requests().back();
    EXPECT_EQ(request.method, "POST");
    EXPECT_EQ(request.target, "/log?x");
    EXPECT_EQ(request.header("Content-Type"), "application/octet-stream");
    EXPECT_EQ(*unarchiveValue(request.body), Value(logData));
  }
  EXPECT_EQ(server.count(), std::size(cases)) << "nothing is sent again";

  // Cases that can't be sent, and cases that must not be.
  auto refused = [&](const std::string& line) {
    EXPECT_EQ(_log.lines(), (std::vector{std::pair(3, line)}));
    _log.clear();
  };
  _log.clear();
  EXPECT_FALSE(backend->uploadLogData(List{"\xff"}));
  refused(upload + "Failed to serialize log data array for upload");
  EXPECT_FALSE(make(profile(Dictionary{{"post_url", "ftp://127.0.0.1/"}}))->uploadLogData(List{1}));
  refused(failed + "not an http or https URL)");
  server.answerWith(HTTPAnswer::text(200, "kept"));
  const List large{std::string(UploadGate::kSmallLogData, 'x')};
  _services.uploads = std::make_shared<UploadGate>(UploadGate::Limits{
      .uploads = 1, .uploadsOfUser = 1, .smallUploads = 2, .smallUploadsOfUser = 1, .patience = {}});
  for (const bool isSmall : {false, true}) {
    auto client = identity();
    client._client.user = 7;
    auto limited = make(profile(Dictionary{{"post_url", server.url("/log")}}), client);
    auto another = isSmall ? _services.uploads->enterWithLogData(7, 0) : _services.uploads->enter(7, 0);
    EXPECT_TRUE(limited->uploadLogData(isSmall ? large : List{1})) << "each kind has places of its own";
    _log.clear();
    EXPECT_FALSE(limited->uploadLogData(isSmall ? List{1} : large));
    refused(failed + "too many uploads are under way)");
    client._client.user = 8;
    limited = make(profile(Dictionary{{"post_url", server.url("/log")}}), client);
    EXPECT_EQ(limited->uploadLogData(isSmall ? List{1} : large), isSmall) << "another user's place";
    another.reset();
    EXPECT_TRUE(limited->uploadLogData(isSmall ? List{1} : large));
    _log.clear();
  }
  _services.http.stopAllButPosts();
  EXPECT_FALSE(backend->uploadLogData(List{1}));
  refused(failed + "the daemon stops)");
}

}  // namespace
}  // namespace vesk::test
