#include <gtest/gtest.h>

#include "tests/support/RecordingServer.h"
#include "tests/support/TempDirectory.h"
#include "tests/support/WebRequest.h"

namespace vesk {
namespace {

using test::TempDirectory;
using test::WebClient;

HTTPAnswer echo(const HTTPReceived& received) { return HTTPAnswer::text(200, received.method); }

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

  files.write("other/ca.pem", CertificateAuthority::generate().certificate());
  EXPECT_THROW(CertificateAuthority::openOrCreate(files / "other"), std::runtime_error);
  files.write("ca.pem", "no certificate");
  EXPECT_THROW(CertificateAuthority::openOrCreate(files.path()), std::runtime_error);
  EXPECT_THROW(kept.issueServerIdentity({"a,DNS:b"}), std::runtime_error);
}

}  // namespace
}  // namespace vesk
