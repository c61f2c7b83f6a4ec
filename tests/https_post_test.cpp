// Posts on the wire, and what their answers do.
#include "tests/support/HTTPSBackendTest.h"
#include "tests/support/TestRoot.h"
#include "util/Gzip.h"

namespace vesk::test {
namespace {

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
  std::vector<Value> filters;  // which leave nothing but the payload
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

TEST_F(HTTPSPost, PrintableTextIsThePostedBody) {
  auto backend = make(entry(), {.batchEvents = true});
  send(*backend, Dictionary{{"n", 1}});
  const auto printable = backend->flushMessages().value();
  EXPECT_TRUE(printable.starts_with("{\n    \"postTime\": 1700000000.0,\n")) << printable;
  EXPECT_EQ(boost::json::parse(printable), boost::json::value(take().body));
}

TEST_F(HTTPSPost, AnswersDecideTheState) {
  const struct {
    std::vector<unsigned> statuses;
    std::optional<DropReason> dropped;
  } cases[] = {{{200, 299}, {}},
               {{302, 404, 499, 600}, DropReason::ServerRefused},
               {{500, 503, 599}, DropReason::ServerError5xx}};
  // The status decides, also when the rest of the answer does not arrive.
  for (auto fault : {HTTPAnswer::Fault::None, HTTPAnswer::Fault::CloseMidAnswer}) {
    for (const auto& test : cases) {
      for (const unsigned status : test.statuses) {
        SCOPED_TRACE(status);
        CapturedLog log;
        const auto dropped = [&] { return test.dropped ? harness.dropped(*test.dropped) : 0; };
        const auto before = dropped();
        harness.answerWith(status, fault);
        auto backend = make(entry(), {.batchEvents = true});
        for (int i = 0; i < 2; ++i) send(*backend);
        backend->flushMessages();
        take();
        const long disables = test.dropped == DropReason::ServerError5xx ? 1 : 0;
        EXPECT_EQ(backend->state(), disables ? BackendStateDisabled : BackendStateEnabled);
        EXPECT_EQ(dropped() - before, test.dropped ? 2u : 0u) << "each event of the batch";
        EXPECT_EQ(log.count(6, "postJSONMessage: backend httpPost disabled by server " +
                                   std::to_string(status) + " return code"),
                  disables);
        EXPECT_EQ(log.countContaining(3, "post error: "), fault == HTTPAnswer::Fault::None ? 0 : 1);
      }
    }
  }
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
