// The HTTP client against a real server: requests on the wire, TLS, limits, and shutdown.
#include <gtest/gtest.h>

#include <cstdlib>
#include <thread>

#include "tests/support/CapturedLog.h"
#include "tests/support/HTTPRequests.h"
#include "tests/support/RecordingServer.h"
#include "tests/support/TempDirectory.h"

namespace vesk::test {
namespace {

using namespace std::chrono_literals;
using Fault = HTTPAnswer::Fault;
using Kind = HTTPError::Kind;

template <class Condition>
void waitFor(Condition condition) {
  while (!condition()) std::this_thread::yield();
}

TEST(HTTPClient, SendsWhatItIsGivenAndLittleElse) {
  RecordingServer server([](const HTTPReceived&, std::size_t) {
    auto answer = HTTPAnswer::text(201, "made");
    answer.headers.emplace_back("Cache-Control", "max-age=600");
    return answer;
  });
  HTTPClient client;
  auto request = postTo(server.url("/a?b=c"), std::string(5u << 20, '\0'));  // also no "Expect: 100-continue"
  request.headers = {{"X-Vesk-Second", "2"},
                     {"X-Vesk-Empty", ""},
                     {"Accept", "application/json"},
                     {"Content-Type", "application/json"},
                     {"Content-Length", std::to_string(request.body.size())}};
  auto result = client.perform(request);

  ASSERT_TRUE(result.response);
  EXPECT_EQ(result.response->status, 201);
  EXPECT_EQ(result.response->header("cache-CONTROL"), "max-age=600");
  EXPECT_NE(result.response->body.find("made"), std::string::npos);
  ASSERT_EQ(server.count(), 1u);
  auto received = server.requests().front();
  EXPECT_EQ(received.method, "POST");
  EXPECT_EQ(received.target, "/a?b=c");
  EXPECT_TRUE(received.body == request.body);
  std::erase_if(received.headers, [](const auto& header) { return header.first == "Host"; });
  request.headers.insert(request.headers.begin(), {"User-Agent", "veskreportingd"});
  EXPECT_EQ(received.headers, request.headers);
}

TEST(HTTPClient, LeavesOutHeadersThatWouldBreakTheRequestApart) {
  CapturedLog log;
  RecordingServer server;
  HTTPClient client;
  auto request = postTo(server.url());
  request.headers = {{"X-Good", "fine: äöü"}, {"X-Line", "a\r\nX-Injected: 1"},
                     {"X-Feed", "a\nb"},      {"X-Nul", std::string("a\0b", 3)},
                     {"X-Tab", "a\tb"},       {"X Blank", "a"},
                     {"X-Colon: b", "a"},     {"", "a"},
                     {"X-Delete", "\x7f"}};
  ASSERT_TRUE(client.perform(request).response);
  auto received = server.requests().front();
  EXPECT_EQ(received.header("X-Good"), "fine: äöü");
  for (const auto& [name, value] : received.headers) {
    EXPECT_TRUE(!name.starts_with("X-") || name == "X-Good") << name;
  }
  EXPECT_EQ(log.countContaining(4, "left out"), 8);
}

TEST(HTTPClient, VerifiesTheServerAgainstTheGivenAuthorities) {
  TempDirectory directory;
  auto authority = CertificateAuthority::generate();
  auto file = directory.write("ca.pem", authority.certificate());
  RecordingServer good({}, {.tls = authority.issueServerIdentity()});
  RecordingServer otherName({}, {.address = "127.0.0.2", .tls = authority.issueServerIdentity()});
  RecordingServer otherAuthority({}, {.tls = CertificateAuthority::generate().issueServerIdentity()});
  RecordingServer expired({}, {.tls = authority.issueServerIdentity({}, 0)});
  std::string otherNameURL = "https://127.0.0.2:" + std::to_string(otherName.server().port());

  ::setenv("SSL_CERT_FILE", file.c_str(), 1);
  HTTPClient client;
  ::unsetenv("SSL_CERT_FILE");
  HTTPClient systemClient;

  EXPECT_TRUE(client.perform(postTo(good.url())).response);
  EXPECT_TRUE(client.perform(postTo(good.url())).response);
  EXPECT_EQ(good.server().connectionsAccepted(), 1u);
  for (auto [which, url] : {std::pair(&client, otherNameURL),
                            {&client, otherAuthority.url()},
                            {&client, expired.url()},
                            {&systemClient, good.url()}}) {
    auto result = which->perform(postTo(url, "event", HTTPRequest::Retry::Never));
    ASSERT_TRUE(result.error) << url;
    EXPECT_EQ(result.error->kind, Kind::TLS) << result.error->description;
  }
  EXPECT_EQ(good.count(), 2u);
  EXPECT_EQ(otherName.count() + otherAuthority.count() + expired.count(), 0u);
}

TEST(HTTPClient, FollowsOnlyHTTPAndNoRedirect) {
  RecordingServer server([](const HTTPReceived&, std::size_t) {
    HTTPAnswer answer;
    answer.status = 302;
    answer.headers.emplace_back("Location", "/elsewhere");
    return answer;
  });
  HTTPClient client;
  EXPECT_EQ(client.perform(fetchFrom(server.url())).response->status, 302);
  EXPECT_EQ(server.count(), 1u);
  for (const char* url :
       {"", "localhost", "file:///etc/passwd", "http://", "http://a b/", "http://a\r\nb/"}) {
    auto result = client.perform(postTo(url));
    ASSERT_TRUE(result.error) << url;
    EXPECT_EQ(result.error->kind, Kind::BadURL) << url << ": " << result.error->description;
    EXPECT_FALSE(result.response);
  }
  // A label that is too long fails without a query.
  EXPECT_EQ(client.perform(fetchFrom("http://" + std::string(64, 'a') + "/")).error->kind, Kind::Resolve);
}

TEST(HTTPClient, BadAnswersAreErrorsOfTheirKindAndOverWithTheNextRequest) {
  const struct {
    Fault fault;
    Kind kind;
    HTTPRequest::Retry retry;  // a complete request is never sent again
  } cases[] = {{Fault::ResetBeforeAnswer, Kind::Interrupted, HTTPRequest::Retry::Never},
               {Fault::CloseWithoutAnswer, Kind::Interrupted, HTTPRequest::Retry::Never},
               {Fault::ResetMidAnswer, Kind::Interrupted, HTTPRequest::Retry::UntilSent},
               {Fault::CloseMidAnswer, Kind::Interrupted, HTTPRequest::Retry::UntilSent},
               {Fault::Stall, Kind::Timeout, HTTPRequest::Retry::UntilSent},
               {Fault::Garbage, Kind::Other, HTTPRequest::Retry::UntilSent}};
  TempDirectory directory;
  const auto authority = CertificateAuthority::generate();
  ::setenv("SSL_CERT_FILE", directory.write("ca.pem", authority.certificate()).c_str(), 1);
  for (const auto& [fault, kind, retry] : cases) {
    SCOPED_TRACE(static_cast<int>(fault));
    RecordingServer server(
        [fault = fault](const HTTPReceived&, std::size_t count) {
          return faulty(count == 0 ? fault : Fault::None, "0123456789");
        },
        {.tls = authority.issueServerIdentity()});
    HTTPClient client;
    auto request = postTo(server.url(), "event", retry);
    if (fault == Fault::Stall) request.timeout = 2s;
    const auto result = client.perform(request);
    EXPECT_EQ(server.count(), 1u);
    ASSERT_TRUE(result.error);
    EXPECT_EQ(result.error->kind, kind) << result.error->description;
    if (fault != Fault::ResetMidAnswer) {
      EXPECT_EQ(result.response.has_value(), fault == Fault::CloseMidAnswer);
    }
    EXPECT_EQ(client.perform(fetchFrom(server.url())).response->body, "0123456789");
  }
  ::unsetenv("SSL_CERT_FILE");
}

TEST(HTTPClient, GivesUpWhatMovesTooSlowlyAndOnlyThat) {
  RecordingServer server([](const HTTPReceived& received, std::size_t) {
    auto answer = faulty(received.method == "POST" ? Fault::SlowBody : Fault::Stall, "0123456789");
    answer.pause = 150ms;
    return answer;
  });
  HTTPClient client;
  for (auto request : {postTo(server.url()), fetchFrom(server.url())}) {
    request.leastBytesPerSecond = 1;
    request.slowFor = 1s;
    const HTTPResult result = client.perform(request);
    EXPECT_EQ(result.response.has_value(), request.method == "POST");
    EXPECT_TRUE(!result.error || result.error->kind == Kind::Timeout) << result.error->description;
  }
}

TEST(HTTPClient, ItsEndFailsWhatIsOutstandingAtOnce) {
  RecordingServer server([](const HTTPReceived&, std::size_t) { return faulty(Fault::Stall); });
  auto client = std::make_unique<HTTPClient>();
  std::vector<Kind> kinds;
  auto note = [&](const HTTPResult& result) { kinds.push_back(result.error->kind); };
  for (int i = 0; i < 20; ++i) client->start(postTo(server.url()), note);
  client->start(fetchFrom(server.url()), [&, again = client.get()](const HTTPResult& result) {
    note(result);
    again->start(fetchFrom(server.url()), note);
  });
  waitFor([&] { return server.count() == 8; });
  // Two that wait for a retry: the port of the stopped server refuses connections.
  std::string gone = [] { return RecordingServer().url(); }();
  client->start(postTo(gone), note);
  client->start(postTo(gone), note);
  client.reset();
  EXPECT_EQ(kinds, std::vector<Kind>(24, Kind::Stopped));
}

TEST(HTTPClient, StopsAllButPosts) {
  RecordingServer server([](const HTTPReceived& received, std::size_t) {
    return received.method == "POST" ? HTTPAnswer::text(200, "ok") : faulty(Fault::Stall);
  });
  HTTPClient client(HTTPClient::Options{.maximumConnectionsPerHost = 2});
  std::vector<Kind> kinds;
  auto note = [&](const HTTPResult& result) { kinds.push_back(result.error->kind); };
  for (int i = 0; i < 3; ++i) client.start(fetchFrom(server.url()), note);  // one waits for a connection
  waitFor([&] { return server.count() == 2; });
  bool posted = false;
  client.start(postTo(server.url()), [&](const HTTPResult& result) { posted = result.response.has_value(); });
  client.stopAllButPosts();
  client.start(fetchFrom(server.url()), note);
  ASSERT_TRUE(client.waitUntilIdle(30s));  // a fetch's own timeout is a minute
  EXPECT_EQ(kinds, std::vector<Kind>(4, Kind::Stopped));
  EXPECT_TRUE(posted);
  HTTPClient unused;
  unused.stopAllButPosts();
  EXPECT_EQ(unused.perform(fetchFrom(server.url())).error->kind, Kind::Stopped);
}

}  // namespace
}  // namespace vesk::test
