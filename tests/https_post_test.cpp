// Posts on the wire, and the effect of their answers.
#include "backends/https/RefusedPosts.h"
#include "tests/support/HTTPSBackendTest.h"
#include "tests/support/TestRoot.h"
#include "util/Gzip.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;
using HTTPSPost = HTTPSBackendTest;

TEST_F(HTTPSPost, HeadersTellWhoSends) {
  const auto named = userNamed("Cam\r\nX-Evil: 1", "Clips");
  for (const bool isBatch : {false, true}) {
    auto backend =
        make(entry(),
             {.userInfo = isBatch ? Dictionary() : named, .batchEvents = isBatch, .isInternal = !isBatch});
    send(*backend, Dictionary{{"bulk", std::string(1000, 'x')}});
    backend->flushMessages();
    const auto post = take().request;
    Lines lines;
    for (const auto& [name, value] : post.headers)
      if (name.starts_with("X-") || name == "Accept" || name.starts_with("Content"))
        lines.push_back(name + ": " + value);
    const std::string length = std::to_string(post.body.size());
    const Lines tail{"Accept: application/json", "Content-Type: application/json",
                     "Content-Length: " + length, "Content-Encoding: gzip"};
    Lines expected{"X-Vesk-Sender: HD"};
    if (!isBatch)
      expected = {"X-Vesk-Client-Name: CamX-Evil: 1", "X-Vesk-Service-Name: Clips",
                  "X-Vesk-Internal-Build: 1", "X-Vesk-Sender: HD", "X-Vesk-Event-Map: 3 2"};
    expected.insert(expected.end(), tail.begin(), tail.end());
    EXPECT_EQ(lines, expected);
    EXPECT_EQ(post.method, "POST");
  }
}

TEST_F(HTTPSPost, SenderFollowsTheClientType) {
  const std::string_view codes[] = {"",   "QX", "WB", "JYP", "KF", "UZ", "HD",
                                    "EP", "YW", "BQ", "FX",  "DJ", "OZ", ""};
  for (int type = -1; const auto code : codes) {
    send(*make(entry(), {.clientType = type++}));
    const auto post = take();
    const auto event = post.event();
    const auto* sent = event.if_contains("_sender");
    EXPECT_EQ(sent ? std::string_view(sent->as_string()) : "", code);
    EXPECT_EQ(post.request.header("X-Vesk-Sender").value_or(""), code);
    EXPECT_EQ(post.request.header("X-Vesk-Sender").has_value(), !code.empty());
  }
}

TEST_F(HTTPSPost, BodyIsCompressedOnlyWhereThatIsShorter) {
  std::vector<Value> filters;  // these leave nothing but the payload
  for (const char* key :
       {"_startTS", "_sender", "_clientVersion", "_sessionID", "_eventNumber", "_method", "_status",
        "_clientTS", "eventTime", "_productFamily", "_productModel", "_osVersion", "_internal", "_reportVers",
        "_timezoneOffset", "clientName", "serviceName"})
    filters.emplace_back(Dictionary{{"key", key}, {"action", "remove"}});
  auto backend = make(entry({{"filters", List(filters)}}));
  int sizes[3] = {};
  for (std::size_t length = 0; length < 60; ++length) {
    const std::string text(length, 'x');
    send(*backend, Dictionary{{"t", text}});
    const std::string plain =
        R"({"postTime":1700000000.0,"clientId":"id-respecting","events":[{"t":")" + text + R"("}]})";
    const std::string compressed = gzipDeflate(plain).value();
    const auto post = take().request;
    const bool isShorter = compressed.size() < plain.size();
    EXPECT_EQ(post.body, isShorter ? compressed : plain);
    EXPECT_EQ(post.header("Content-Length"), std::to_string(post.body.size()));
    EXPECT_EQ(post.header("Content-Encoding").has_value(), isShorter);
    ++sizes[isShorter ? 0 : compressed.size() == plain.size() ? 1 : 2];
  }
  for (int seen : sizes) EXPECT_GT(seen, 0) << "shorter, as long, longer";
}

TEST_F(HTTPSPost, AnswersDecideTheState) {
  const std::pair<std::vector<unsigned>, std::optional<DropReason>> cases[] = {
      {{200, 299}, {}},
      {{302, 404, 499, 600}, DropReason::ServerRefused},
      {{500, 503, 599}, DropReason::ServerError5xx}};
  // The status decides, even if the rest of the answer does not arrive.
  for (auto fault : {HTTPAnswer::Fault::None, HTTPAnswer::Fault::CloseMidAnswer}) {
    for (const auto& [statuses, reason] : cases) {
      for (const unsigned status : statuses) {
        SCOPED_TRACE(status);
        CapturedLog log;
        const auto before = reason ? harness.dropped(*reason) : 0;
        harness.answerWith(status, fault);
        auto backend = make(entry(), {.batchEvents = true});
        for (int i = 0; i < 2; ++i) send(*backend);
        backend->flushMessages();
        take();
        const long disables = reason == DropReason::ServerError5xx ? 1 : 0;
        EXPECT_EQ(backend->state(), disables ? BackendStateDisabled : BackendStateEnabled);
        EXPECT_EQ(reason ? harness.dropped(*reason) - before : 2, 2u) << "each event of the batch";
        EXPECT_EQ(log.count(6, "postJSONMessage: backend httpPost disabled by server " +
                                   std::to_string(status) + " return code"),
                  disables);
        EXPECT_EQ(log.countContaining(3, "post error: "), fault == HTTPAnswer::Fault::None ? 0 : 1);
      }
    }
  }
}

TEST(RefusedPosts, OneLineABurstCountsTheEvents) {
  // line: null: none
  const std::tuple<const char*, long, std::size_t, std::chrono::seconds, const char*> cases[] = {
      {"httpPost", 404, 3, 0s, "backend httpPost: server answered 404, events lost: 3"},
      {"httpPost", 404, 50, 1s, nullptr},
      {"httpPost2", 302, 1, 1s, "backend httpPost2: server answered 302, events lost: 1"},
      {"httpPost", 410, 7, 10s, nullptr},
      {"httpPost", 302, 1, 20s, "backend httpPost: server answered 302, events lost: 58"},
      {"httpPost", 404, 2, 60s, "backend httpPost: server answered 404, events lost: 2"}};
  RefusedPosts refused;
  for (const auto& [backend, status, events, at, line] : cases) {
    CapturedLog log;
    refused.note(backend, status, events, RefusedPosts::Instant(1h) + at);
    std::vector<std::pair<int, std::string>> expected;
    if (line) expected = {{4, std::string("HTTPSPostBackend(postJsonMessage): ") + line}};
    EXPECT_EQ(log.lines(), expected) << at.count();
  }
}

TEST_F(HTTPSPost, AnAnswerThatIsNeitherSuccessNorAnErrorIsNoted) {
  CapturedLog log;
  auto backend = make(entry());
  for (unsigned status : {200u, 404u, 503u}) {
    harness.answerWith(status);
    send(*backend);
    take();
  }
  EXPECT_EQ(log.countContaining(4, ""), 1);
  EXPECT_EQ(log.countContaining(4, "backend httpPost: server answered 404, events lost: 1"), 1);
}

TEST_F(HTTPSPost, WhatHasNowhereToGoIsCounted) {
  auto backend = make(entry({}, "post_url"), {.batchEvents = true});
  for (int i = 0; i < 2; ++i) send(*backend);
  EXPECT_TRUE(backend->flushMessages());
  EXPECT_EQ(harness.dropped(DropReason::NoURL), 2u);
  CapturedLog log;
  auto elsewhere = make(entry({{"post_url", "ftp://host/"}}));
  send(*elsewhere);
  EXPECT_EQ(takeTargets(), Lines{});
  EXPECT_EQ(harness.dropped(DropReason::TransportError), 1u);
  EXPECT_EQ(linesOf(log).back(), "3 HTTPSPostBackend(postJsonMessage): post error: not an http or https URL");
}

}  // namespace
}  // namespace vesk::test
