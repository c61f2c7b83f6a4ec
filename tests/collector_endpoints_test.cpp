#include <gtest/gtest.h>
#include <utime.h>

#include <algorithm>

#include "tests/support/TempDirectory.h"
#include "tools/collector/EventsEndpoint.h"
#include "tools/collector/FileEndpoints.h"
#include "tools/collector/StorebagEndpoint.h"
#include "tools/json/JSONReader.h"
#include "tools/storebag/StorebagSigning.h"
#include "util/Gzip.h"

namespace vesk {
namespace {

using test::TempDirectory;

std::string gzip(const std::string& text) { return gzipDeflate(text).value(); }

HTTPReceived request(std::string method, std::string target, HTTPHeaderList headers = {},
                     std::string body = {}) {
  return {std::move(method), std::move(target), std::move(headers), std::move(body), "127.0.0.1:1"};
}

constexpr char kGoodBody[] =
    R"({"postTime":1795555743.25,"clientId":"c","events":[{"_method":3,"_status":2,"user":"a\nb","n":1.5}]})";

HTTPReceived post(std::string body = kGoodBody, const HTTPHeaderList& replaced = {}) {
  HTTPHeaderList headers{{"X-Vesk-Sender", "HD"},
                         {"Accept", "application/json"},
                         {"Content-Type", "application/json"},
                         {"Content-Length", std::to_string(body.size())}};
  for (const auto& [name, value] : replaced) {
    std::erase_if(headers, [&, &header = name](const auto& entry) { return entry.first == header; });
    if (value != "absent") headers.emplace_back(name, value);
  }
  return request("POST", "/events/realtime", std::move(headers), std::move(body));
}

class CollectorEndpoints : public ::testing::Test {
 protected:
  TempDirectory _files;
  Console _console{Console::Style::Readable};
  CollectorStats _stats;
  FaultPlan _faults;
  EventsEndpoint _events{{_console, _stats, _faults}, _files / "events.jsonl"};
};

// The road tests check what is saved of an event.
TEST_F(CollectorEndpoints, TakePostsAndSaveTheirEvents) {
  EXPECT_EQ(_events.answer(post(kGoodBody, {{"X-Vesk-Event-Map", "3 2"}})).status, 200U);
  EXPECT_EQ(_events.answer(post(gzip(kGoodBody), {{"Content-Encoding", "gzip"}})).status, 200U);
  EXPECT_EQ(_events.answer(post(kGoodBody, {{"X-Vesk-Client-Name", "\xff"}})).status, 200U);
  std::istringstream lines(_files.read("events.jsonl"));
  for (std::string line; std::getline(lines, line);) EXPECT_TRUE(parseJSON(line)) << line;
  EXPECT_EQ(_stats.events, 3U);
}

TEST_F(CollectorEndpoints, LeaveOutRepeatedEvents) {
  const auto body = [](const std::string& event) {
    return R"({"postTime":1,"clientId":"c","events":[{)" + event + "}]}";
  };
  const std::string whole = R"("_sessionID":"7","_eventNumber":1,"_method":3,"_status":2,"_clientTS":9.5)";
  const HTTPReceived first = post(body(whole));
  HTTPReceived elsewhere = first;
  elsewhere.target = "/events";
  HTTPReceived other = post(body(whole + "},{" + whole + R"(},{"user":"b")"));
  EventsEndpoint full({_console, _stats, _faults}, _files / "full" / "events.jsonl");
  EXPECT_EQ(full.answer(first).fault, HTTPAnswer::Fault::CloseWithoutAnswer);
  _files.write("full/events.jsonl", "");
  const struct {
    const char* name;
    EventsEndpoint& endpoint;
    HTTPReceived received;
    unsigned events, repeated;
  } cases[] = {
      {"new", _events, first, 1, 0},
      {"sent again", _events, post(body(whole), {{"X-Vesk-Event-Map", "3 2"}}), 0, 1},
      {"other URL", _events, elsewhere, 1, 0},
      {"in part", _events, other, 1, 2},
      {"a key is missing", _events, post(body(whole.substr(0, whole.rfind(',')))), 1, 0},
      {"and again", _events, post(body(whole.substr(0, whole.rfind(',')))), 1, 0},
      {"not saved before", full, first, 1, 0},
  };
  std::uint64_t events = 0, repeated = 0;
  for (const auto& test : cases) {
    EXPECT_EQ(test.endpoint.answer(test.received).status, 200U) << test.name;
    EXPECT_EQ(_stats.events, events += test.events) << test.name;
    EXPECT_EQ(_stats.eventsRepeated, repeated += test.repeated) << test.name;
  }
  const std::string saved = _files.read("events.jsonl");
  EXPECT_EQ(static_cast<std::uint64_t>(std::count(saved.begin(), saved.end(), '\n')), events - 1);
}

TEST_F(CollectorEndpoints, TakeFilesUnderNamesThatLeadNowhere) {
  UploadsEndpoint uploads({_console, _stats, _faults}, _files / "uploads", "as told");
  const HTTPHeaderList packed{{"Content-Encoding", "gzip"}};
  const std::string good = "/uploads?sequence=7&filename=";
  EXPECT_EQ(uploads.answer(request("POST", "/uploads", packed, gzip("x"))).status, 400U);
  EXPECT_EQ(uploads.answer(request("POST", good + "a.gz", packed, "x")).status, 400U);
  EXPECT_EQ(_stats.uploads, 0U);
  EXPECT_EQ(uploads.answer(request("POST", good + "%2e%2e%2Fa%20b.gz", packed, gzip("x"))).body, "as told\n");
  EXPECT_EQ(_files.read("uploads/1-.._a b.gz"), gzip("x"));
  UploadsEndpoint nowhere({_console, _stats, _faults}, _files.write("file", "") / "below", "as told");
  EXPECT_EQ(nowhere.answer(request("POST", good + "a.gz", packed, gzip("x"))).status, 500U);
  EXPECT_EQ(_stats.refused, 3U);
  EXPECT_EQ(_stats.uploads, 1U);
}

TEST_F(CollectorEndpoints, RefuseWhatIsNoPostAndSaveNothing) {
  const struct {
    const char* name;
    HTTPReceived received;
    unsigned status;
    const char* reason;
  } cases[] = {
      {"method", request("GET", "/events"), 405, "must be POST"},
      {"media type", post(kGoodBody, {{"Content-Type", "text/plain"}}), 400, "not 'text/plain'"},
      {"gzip and more", post(gzip(kGoodBody) + "x", {{"Content-Encoding", "gzip"}}), 400, "bytes follow"},
      {"sender", post(kGoodBody, {{"X-Vesk-Sender", "hd"}}), 400, "X-Vesk-Sender"},
      {"map of many",
       post(R"({"postTime":1,"clientId":"c","events":[{},{}]})", {{"X-Vesk-Event-Map", "3 2"}}), 400,
       "a post of 2 events"},
      {"more than JSON", post(std::string(kGoodBody) + "{}"), 400, "no JSON"},
      {"event", post(R"({"postTime":1,"clientId":"c","events":[{},3]})"), 400, "events[1] must be an object"},
      {"further key", post(R"({"postTime":1,"clientId":"c","events":[{}],"x":1})"), 400, "unknown key 'x'"},
  };
  for (const auto& test : cases) {
    HTTPAnswer answer = _events.answer(test.received);
    EXPECT_EQ(answer.status, test.status) << test.name;
    EXPECT_NE(answer.body.find(test.reason), std::string::npos) << test.name << ": " << answer.body;
  }
  EXPECT_EQ(_stats.refused, std::size(cases));
  EXPECT_EQ(_files.read("events.jsonl"), "");
}

TEST_F(CollectorEndpoints, LeaveAPostUnansweredThatCanNotBeSaved) {
  EventsEndpoint events({_console, _stats, _faults}, "/dev/full");
  for (const char* fault : {"none", "answer=204", "slow", "empty-body"}) {
    EXPECT_FALSE(_faults.add("post=" + std::string(fault)));
    EXPECT_EQ(events.answer(post()).fault, HTTPAnswer::Fault::CloseWithoutAnswer) << fault;
  }
  EXPECT_FALSE(_faults.add("post=none"));
  EXPECT_EQ(_stats.eventsNotSaved, 4U);
}

TEST_F(CollectorEndpoints, GiveFaultsInTheirOrderAndAsOftenAsAsked) {
  for (const char* bad : {"post", "past=500", "post=500*0"}) EXPECT_TRUE(_faults.add(bad)) << bad;
  for (const char* good : {"post=503*2", "post=answer=204*1", "post=slow*1", "post=reset", "logdata=500"})
    EXPECT_FALSE(_faults.add(good)) << good;
  const std::tuple<unsigned, HTTPAnswer::Fault, std::size_t> expected[] = {
      {503, HTTPAnswer::Fault::None, 0},
      {503, HTTPAnswer::Fault::None, 0},
      {204, HTTPAnswer::Fault::None, 1},
      {200, HTTPAnswer::Fault::SlowBody, 2},
      {200, HTTPAnswer::Fault::ResetBeforeAnswer, 2},
      {200, HTTPAnswer::Fault::ResetBeforeAnswer, 2},
  };
  for (const auto& [status, fault, taken] : expected) {
    HTTPAnswer answer = _events.answer(post());
    EXPECT_EQ(answer.status, status);
    EXPECT_EQ(answer.fault, fault);
    EXPECT_EQ(_stats.posts, taken);
  }
  EXPECT_EQ(_stats.faults, 6U);
}

class StorebagServing : public CollectorEndpoints {
 protected:
  HTTPAnswer get(const std::string& path, const std::string& since = {}) {
    HTTPHeaderList headers;
    if (!since.empty()) headers.emplace_back("If-Modified-Since", since);
    return _endpoint.answer(request("GET", path, headers));
  }
  std::string problemOf(const HTTPAnswer& answer) const {
    return inspectStorebag(answer.body, _key.publicKeyDER()).problem;
  }
  void writeVersion(const std::string& version, std::time_t modified) {
    auto file = _files.write("zelko.toml", "version = '" + version + "'\n[release.wren]\nactive = true\n");
    utimbuf times{modified, modified};
    ASSERT_EQ(::utime(file.c_str(), &times), 0);
  }

  const SigningKey _key = SigningKey::generate();
  StorebagEndpoint _endpoint{
      {_console, _stats, _faults}, _files.path(), StorebagChecks::Strict, _key, std::chrono::seconds(60)};
};

TEST_F(StorebagServing, SignsOnTheFlyAndAnswersConditionally) {
  writeVersion("1", 1'795'552'289);
  HTTPAnswer answer = get("/bags/sorrel/zelko?version=7.0");
  EXPECT_EQ(answer.status, 200U);
  EXPECT_EQ(problemOf(answer), "");
  EXPECT_EQ(findHeader(answer.headers, "Last-Modified"), "Tue, 24 Nov 2026 20:31:29 GMT");
  EXPECT_EQ(findHeader(answer.headers, "Cache-Control"), "max-age=60");

  EXPECT_EQ(get("/bags/sorrel/zelko", "Tue, 24 Nov 2026 20:31:29 GMT").status, 304U);
  EXPECT_EQ(get("/bags/sorrel/zelko", "Tue, 24 Nov 2026 20:31:28 GMT").status, 200U);
  EXPECT_EQ(get("/bags/sorrel/zelko", "yesterday").status, 200U);
}

TEST_F(StorebagServing, RefusesNamesItDoesNotHaveAndSourcesWithMistakes) {
  _files.write("../outside.toml", "version = '1'");
  _files.write("bad.json", R"({"version": 1})");
  _files.write("good.json", R"({"version": "1", "release": {}})");
  for (const char* path :
       {"/bags/zelko", "/bags/", "/bags/..%2foutside", "/bags/../outside", "/bags/good.json"})
    EXPECT_EQ(get(path).status, 404U) << path;
  std::filesystem::remove(_files / "../outside.toml");
  HTTPAnswer bad = get("/bags/bad");
  EXPECT_EQ(bad.status, 500U);
  EXPECT_NE(bad.body.find("bad.json: version: must be a text"), std::string::npos);
  EXPECT_EQ(problemOf(get("/bags/good")), "");
  EXPECT_EQ(_endpoint.answer(request("POST", "/bags/good")).status, 405U);
}

}  // namespace
}  // namespace vesk
