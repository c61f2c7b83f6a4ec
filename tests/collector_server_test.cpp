#include <gtest/gtest.h>

#include <atomic>
#include <condition_variable>
#include <mutex>
#include <thread>

#include "tests/support/TempDirectory.h"
#include "tests/support/WebRequest.h"
#include "tools/collector/CertificateAuthority.h"
#include "tools/collector/HTTPServer.h"

namespace vesk {
namespace {

using Fault = HTTPAnswer::Fault;
using test::TempDirectory;
using test::WebClient;

HTTPAnswer echo(const HTTPReceived& received) {
  HTTPAnswer answer;
  answer.headers = {{"X-Connection", std::to_string(received.connection)}};
  answer.body = received.method + " " + received.target + " " + std::to_string(received.body.size());
  return answer;
}

TEST(CollectorServer, AnswersRequestsOnOneConnectionInOrder) {
  HTTPServer server({}, echo);
  WebClient client;
  for (int i = 0; i < 3; ++i) {
    auto answer =
        client.post(server.baseURL() + "/a?b=" + std::to_string(i), std::string(i * 2'000'000, 'x'));
    EXPECT_EQ(answer.status, 200);
    EXPECT_EQ(answer.body, "POST /a?b=" + std::to_string(i) + " " + std::to_string(i * 2'000'000));
    EXPECT_EQ(answer.headers["x-connection"], "1");
  }
  EXPECT_EQ(server.connectionsAccepted(), 1U);
}

TEST(CollectorServer, KeepsHeadersInOrderAndSpelling) {
  HTTPHeaderList seen;
  HTTPServer server({}, [&](const HTTPReceived& received) {
    seen = received.headers;
    return HTTPAnswer{};
  });
  WebClient().post(server.baseURL(), "{}", {"X-Vesk-Sender: HD", "Accept: application/json", "aCCept-x: 1"});
  ASSERT_GE(seen.size(), 3U);
  std::vector<std::string> names;
  for (const auto& [name, value] : seen) names.push_back(name);
  auto at = [&](const char* name) { return std::find(names.begin(), names.end(), name) - names.begin(); };
  EXPECT_LT(at("X-Vesk-Sender"), at("Accept"));
  EXPECT_LT(at("Accept"), at("aCCept-x"));
  EXPECT_EQ(findHeader(seen, "x-vesk-sender"), "HD");
}

struct FaultCase {
  const char* name;
  Fault fault;
  std::vector<CURLcode> outcomes;
};

class CollectorServerFaults : public ::testing::TestWithParam<std::tuple<bool, FaultCase>> {
 protected:
  CollectorServerFaults() { _files.write("ca.pem", _authority.certificate()); }

  HTTPServer::Options options() const {
    HTTPServer::Options options;
    if (std::get<0>(GetParam())) options.tls = _authority.issueServerIdentity();
    return options;
  }
  WebClient client() const { return WebClient((_files / "ca.pem").string()); }

  const CertificateAuthority _authority = CertificateAuthority::generate();
  TempDirectory _files;
};

TEST_P(CollectorServerFaults, AreSeenByTheClientAndOverWithTheNextRequest) {
  const FaultCase& test = std::get<1>(GetParam());
  std::atomic<bool> faulty = true;
  HTTPServer server(options(), [&](const HTTPReceived&) {
    HTTPAnswer answer = HTTPAnswer::text(200, "0123456789");
    answer.pause = std::chrono::milliseconds(1);
    answer.hugeBody = 3'000'000;
    if (faulty) answer.fault = test.fault;
    return answer;
  });
  WebClient client = this->client();
  long timeout = test.fault == Fault::Stall ? 300 : 10'000;
  std::string body = "{}";
  auto answer = client.perform("POST", server.baseURL(), {}, &body, timeout);
  EXPECT_NE(std::find(test.outcomes.begin(), test.outcomes.end(), answer.outcome), test.outcomes.end())
      << curl_easy_strerror(answer.outcome);
  if (answer.outcome == CURLE_OK) {
    EXPECT_EQ(answer.status, 200);
    EXPECT_EQ(answer.body.size(), test.fault == Fault::HugeBody ? 3'000'000U : 11U);
  }
  faulty = false;
  EXPECT_EQ(client.post(server.baseURL(), "{}").body, "0123456789\n");
}

INSTANTIATE_TEST_SUITE_P(
    PlainAndTLS, CollectorServerFaults,
    ::testing::Combine(
        ::testing::Bool(),
        ::testing::Values(
            FaultCase{"None", Fault::None, {CURLE_OK}},
            FaultCase{"Stall", Fault::Stall, {CURLE_OPERATION_TIMEDOUT}},
            FaultCase{"ResetBeforeAnswer", Fault::ResetBeforeAnswer, {CURLE_RECV_ERROR}},
            FaultCase{"ResetMidAnswer", Fault::ResetMidAnswer, {CURLE_RECV_ERROR}},
            FaultCase{"CloseWithoutAnswer", Fault::CloseWithoutAnswer, {CURLE_GOT_NOTHING, CURLE_RECV_ERROR}},
            FaultCase{"CloseMidAnswer", Fault::CloseMidAnswer, {CURLE_PARTIAL_FILE, CURLE_RECV_ERROR}},
            FaultCase{"CloseAfterAnswer", Fault::CloseAfterAnswer, {CURLE_OK}},
            FaultCase{"SlowBody", Fault::SlowBody, {CURLE_OK}},
            FaultCase{"Garbage", Fault::Garbage, {CURLE_UNSUPPORTED_PROTOCOL, CURLE_RECV_ERROR}},
            FaultCase{"HugeBody", Fault::HugeBody, {CURLE_OK}})),
    [](const auto& test) {
      return std::string(std::get<0>(test.param) ? "TLS" : "Plain") + std::get<1>(test.param).name;
    });

TEST(CollectorServer, HoldsAnswersUntilReleased) {
  std::mutex mutex;
  std::condition_variable changed;
  bool asked = false;
  HTTPServer server({}, [&](const HTTPReceived&) {
    HTTPAnswer answer = HTTPAnswer::text(200, "at last");
    answer.fault = Fault::Hold;
    std::lock_guard lock(mutex);
    asked = true;
    changed.notify_all();
    return answer;
  });
  test::WebAnswer answer;
  std::thread asking([&] { answer = WebClient().get(server.baseURL()); });
  {
    std::unique_lock lock(mutex);
    changed.wait(lock, [&] { return asked; });
  }
  server.releaseHeld();
  asking.join();
  EXPECT_EQ(answer.body, "at last\n");
}

TEST(CollectorServer, StopsTwiceWithAStalledConnectionAndComesBackOnItsPort) {
  auto stalling = [](const HTTPReceived&) {
    HTTPAnswer answer;
    answer.fault = Fault::Stall;
    return answer;
  };
  auto first = std::make_unique<HTTPServer>(HTTPServer::Options{}, stalling);
  std::uint16_t port = first->port();
  WebClient client;
  std::string url = first->baseURL();
  std::string body = "{}";
  EXPECT_EQ(client.perform("POST", url, {}, &body, 200).outcome, CURLE_OPERATION_TIMEDOUT);

  test::WebAnswer stalled;
  std::thread asking([&] { stalled = WebClient().get(url); });
  while (first->connectionsAccepted() < 2) std::this_thread::yield();
  first->stop();
  first->stop();
  asking.join();
  EXPECT_NE(stalled.outcome, CURLE_OK);
  EXPECT_EQ(WebClient().get(url).outcome, CURLE_COULDNT_CONNECT);

  HTTPServer::Options options;
  options.port = port;
  EXPECT_THROW(HTTPServer({.address = "192.0.2.1"}, echo), std::runtime_error);
  HTTPServer second(options, echo);
  EXPECT_EQ(second.port(), port);
  EXPECT_EQ(client.get(url).status, 200);
}

TEST(CollectorServer, RefusesWhatIsNoProtocolWithALine) {
  std::mutex mutex;
  std::vector<std::string> lines;
  CertificateAuthority authority = CertificateAuthority::generate();
  HTTPServer::Options options;
  options.maximumBody = 1000;
  options.onRefused = [&](const std::string& line) {
    std::lock_guard lock(mutex);
    lines.push_back(line);
  };
  HTTPServer plain(options, echo);
  options.tls = authority.issueServerIdentity();
  HTTPServer secure(options, echo);

  EXPECT_EQ(WebClient().post(plain.baseURL(), std::string(5'000'000, 'x')).status, 413);
  EXPECT_EQ(WebClient().get(plain.baseURL(), {"X-Long: " + std::string(70'000, 'x')}).status, 431);
  EXPECT_NE(WebClient().get("http://127.0.0.1:" + std::to_string(secure.port())).outcome, CURLE_OK);
  EXPECT_NE(WebClient().get("https://127.0.0.1:" + std::to_string(plain.port())).outcome, CURLE_OK);
  plain.stop();
  secure.stop();
  EXPECT_EQ(lines.size(), 4U);
  EXPECT_EQ(plain.connectionsOpen(), 0U);
}

TEST(CollectorServer, TurnsAThrowingHandlerInto500) {
  HTTPServer server({}, [](const HTTPReceived&) -> HTTPAnswer { throw std::runtime_error("out of luck"); });
  EXPECT_EQ(WebClient().get(server.baseURL()).status, 500);
}

TEST(CollectorCertificates, AreKeptAndVerifiedByNameAndAddress) {
  TempDirectory files;
  std::string authority = CertificateAuthority::openOrCreate(files.path()).certificate();
  CertificateAuthority kept = CertificateAuthority::openOrCreate(files.path());
  EXPECT_EQ(kept.certificate(), authority);
  auto permissions = std::filesystem::status(files / "ca.key").permissions();
  EXPECT_EQ(permissions, std::filesystem::perms::owner_read | std::filesystem::perms::owner_write);

  HTTPServer::Options options;
  options.tls = kept.issueServerIdentity({"collector.test", "192.0.2.7"});
  HTTPServer server(options, echo);
  std::string port = std::to_string(server.port());
  WebClient trusting((files / "ca.pem").string());
  EXPECT_EQ(trusting.get("https://localhost:" + port).status, 200);
  EXPECT_EQ(trusting.get("https://127.0.0.1:" + port).status, 200);
  EXPECT_EQ(trusting.get("https://127.0.0.2:" + port).outcome, CURLE_COULDNT_CONNECT);
  EXPECT_EQ(WebClient().get("https://localhost:" + port).outcome, CURLE_PEER_FAILED_VERIFICATION);

  files.write("other/ca.pem", CertificateAuthority::generate().certificate());
  WebClient mistrusting((files / "other/ca.pem").string());
  EXPECT_EQ(mistrusting.get("https://localhost:" + port).outcome, CURLE_PEER_FAILED_VERIFICATION);
  EXPECT_THROW(CertificateAuthority::openOrCreate(files / "other"), std::runtime_error);
  files.write("ca.pem", "no certificate");
  EXPECT_THROW(CertificateAuthority::openOrCreate(files.path()), std::runtime_error);
  EXPECT_THROW(kept.issueServerIdentity({"a,DNS:b"}), std::runtime_error);
}

}  // namespace
}  // namespace vesk
