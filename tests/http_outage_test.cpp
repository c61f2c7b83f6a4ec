// Posts and servers that go away: which posts are retried, which are not, and which are lost.
#include <gtest/gtest.h>

#include <atomic>
#include <boost/asio/io_context.hpp>
#include <boost/asio/ip/tcp.hpp>
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
using Bodies = std::vector<std::string>;

/// Short waits, to keep the tests fast.
HTTPClient::Options quick() { return {.retryFor = 60s, .firstRetryAfter = 5ms}; }

TEST(HTTPOutage, APostThatWasCutOffIsSentAgainUntilItIsAnswered) {
  for (Fault fault : {Fault::ResetBeforeAnswer, Fault::CloseWithoutAnswer}) {
    RecordingServer server([fault](const HTTPReceived&, std::size_t count) {
      return count < 3 ? faulty(fault) : HTTPAnswer::text(200, "ok");
    });
    HTTPClient client(quick());
    auto result = client.perform(postTo(server.url()));
    ASSERT_TRUE(result.response) << result.error->description;
    EXPECT_EQ(server.bodies(), Bodies(4, "event"));
  }
}

TEST(HTTPOutage, AKeptConnectionThatTheServerClosedCostsNothing) {
  RecordingServer server([](const HTTPReceived&, std::size_t) { return faulty(Fault::CloseAfterAnswer); });
  HTTPClient client(quick());
  for (int i = 0; i < 10; ++i) EXPECT_TRUE(client.perform(postTo(server.url())).response);
  EXPECT_EQ(server.bodies(), Bodies(10, "event"));
}

TEST(HTTPOutage, NothingIsLostWhileTheServerIsDown) {
  CapturedLog log;
  RecordingServer server;
  HTTPClient client(quick());
  ASSERT_TRUE(client.perform(postTo(server.url(), "before")).response);
  server.stop();
  std::atomic<int> answered{0};
  Bodies expected{"before"};
  for (int i = 0; i < 40; ++i) {
    expected.push_back("event " + std::to_string(i));
    client.start(postTo(server.url(), expected.back()),
                 [&](const HTTPResult& result) { answered += result.response ? 1 : 0; });
  }
  while (log.countContaining(6, "no answer from " + server.server().baseURL()) == 0) {
    std::this_thread::yield();
  }
  EXPECT_FALSE(client.waitUntilIdle(50ms));
  server.start();
  ASSERT_TRUE(client.waitUntilIdle(60s));
  EXPECT_EQ(answered, 40);
  auto bodies = server.bodies();
  std::sort(bodies.begin(), bodies.end());
  std::sort(expected.begin(), expected.end());
  EXPECT_EQ(bodies, expected);
  EXPECT_EQ(log.countContaining(6, server.server().baseURL() + " answers again"), 1);
}

TEST(HTTPOutage, APostWaitsUntilTheCertificateCanBeVerified) {
  CapturedLog log;
  TempDirectory directory;
  const auto authority = CertificateAuthority::generate();
  ::setenv("SSL_CERT_FILE", directory.write("ca.pem", authority.certificate()).c_str(), 1);
  HTTPClient client(quick());
  ::unsetenv("SSL_CERT_FILE");
  RecordingServer portal({}, {.tls = CertificateAuthority::generate().issueServerIdentity()});
  const std::string url = portal.url();
  HTTPResult result;
  client.start(postTo(url), [&](HTTPResult outcome) { result = std::move(outcome); });
  EXPECT_EQ(client.perform(postTo(url, "upload", HTTPRequest::Retry::Never)).error->kind, Kind::TLS);
  while (log.countContaining(6, "no answer from") == 0) std::this_thread::yield();
  portal.stop();
  RecordingServer server({}, {.port = portal.server().port(), .tls = authority.issueServerIdentity()});
  ASSERT_TRUE(client.waitUntilIdle(60s));
  EXPECT_TRUE(result.response) << result.error->description;
  EXPECT_EQ(portal.count(), 0u);
  EXPECT_EQ(server.bodies(), Bodies{"event"});
}

TEST(HTTPOutage, AnUploadOrFetchIsSentOnceEvenOnAKeptConnection) {
  RecordingServer server([](const HTTPReceived& received, std::size_t) {
    return received.body == "event" ? HTTPAnswer::text(200, "ok") : faulty(Fault::ResetBeforeAnswer);
  });
  HTTPClient client(quick());
  ASSERT_TRUE(client.perform(postTo(server.url())).response);
  auto result = client.perform(postTo(server.url(), "upload", HTTPRequest::Retry::Never));
  ASSERT_TRUE(result.error);
  EXPECT_EQ(result.error->kind, Kind::Interrupted);
  EXPECT_EQ(server.bodies(), (Bodies{"event", "upload"}));
}

TEST(HTTPOutage, AnAnswerOfAnyStatusEndsAPost) {
  for (unsigned status : {404u, 429u, 503u}) {
    RecordingServer server(
        [status](const HTTPReceived&, std::size_t) { return HTTPAnswer::text(status, "no"); });
    EXPECT_EQ(HTTPClient(quick()).perform(postTo(server.url())).response->status, status);
    EXPECT_EQ(server.count(), 1u);
  }
}

TEST(HTTPOutage, AConnectionThatTakesTooLongIsTriedAgain) {
  // Connections are established, but the server sends nothing.
  boost::asio::io_context context;
  boost::asio::ip::tcp::acceptor listener(context, {boost::asio::ip::address_v4::loopback(), 0});
  auto options = quick();
  options.connectTimeout = 20ms;
  HTTPClient client(options);
  client.start(postTo("https://127.0.0.1:" + std::to_string(listener.local_endpoint().port())),
               [](const HTTPResult& result) { EXPECT_EQ(result.error->kind, Kind::Stopped); });
  const auto first = listener.accept(), second = listener.accept();
  EXPECT_TRUE(first.is_open() && second.is_open());
}

}  // namespace
}  // namespace vesk::test
