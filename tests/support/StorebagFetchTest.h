// A storebag server with real TLS, keys and signatures, and a device that fetches from it.
#pragma once

#include <gtest/gtest.h>

#include <cstdlib>

#include "platform/plist/PropertyList.h"
#include "storebag/Settings.h"
#include "storebag/StorebagFallback.h"
#include "storebag/StorebagFetch.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/RecordingServer.h"
#include "tests/support/SignedStorebag.h"
#include "tests/support/TestRoot.h"

namespace vesk::test {

using Lines = std::vector<std::pair<int, std::string>>;

inline const Dictionary kSeed{{"https", Dictionary{{"from", "seed"}}}};
inline const Dictionary kRelease{{"https", Dictionary{{"from", "release"}}}};

inline Dictionary payload(const Dictionary& changes = {}, std::string_view without = "") {
  MutableDictionary whole(Dictionary{{"version", "2.5"}, {"seed", kSeed}, {"release", kRelease}});
  whole.setAll(changes);
  whole.remove(without);
  return whole.share();
}

inline std::string withName(const std::string& text) { return "fetchStorebagWithName: " + text; }
inline std::string forClientType(const std::string& text) {
  return "fetchStorebagForEnvironmentAndClientType: " + text;
}

/// The server, its certificate and the settings exist once per process, since the daemon reads the server's
/// address only once. The environment is the default, "seed".
class StorebagFetch : public testing::Test {
 protected:
  static void SetUpTestSuite() {
    auto authority = CertificateAuthority::generate();
    ::setenv("SSL_CERT_FILE", testRoot().write("ca.pem", authority.certificate()).c_str(), 1);
    _server = new RecordingServer({}, {.tls = authority.issueServerIdentity()});
    testRoot().write("etc/veskreporting/preferences/com.corvane.veskreporting.toml",
                     "veskreporting_storebag_url = '" + base() + "'\n");
    _key = new TestSigningKey;
    ASSERT_EQ(currentEnvironmentType(), 3);
  }
  static void TearDownTestSuite() {
    delete _server;
    delete _key;
  }

  static std::string ownKey() { return _key->publicKeyInfo(); }
  static std::string base() { return _server->url("/bags/sorrel"); }
  static std::string url(const std::string& name) { return base() + "/" + name + "?version=7.3"; }
  static RecordingServer& server() { return *_server; }

  static Dictionary document(const std::string& bag, const std::string& signedBytes) {
    return storebagDocument(*_key, bag, signedBytes);
  }
  static std::string serialized(const Dictionary& dictionary) { return *writeXMLPropertyList(dictionary); }
  static std::string signedStorebag(const Dictionary& content) {
    return test::signedStorebag(*_key, content);
  }
  static void serve(std::string body, HTTPHeaderList headers = {}, unsigned status = 200) {
    HTTPAnswer next;
    next.status = status;
    next.headers = std::move(headers);
    next.body = std::move(body);
    _server->answerWith(std::move(next));
  }

  std::optional<Dictionary> fetch(std::int32_t clientType = 5) {
    maxAge = -1;
    version.reset();
    notModified = false;
    log.clear();
    return fetchStorebagForEnvironmentAndClientType(http, library, clientType, maxAge, version, notModified,
                                                    &lastModified, kept.get());
  }
  /// The HTTP client's description of the failure to fetch that storebag.
  std::string errorOf(const std::string& name) {
    return http.perform(storebagRequest(url(name), std::nullopt)).error->description;
  }
  /// The lines of a fetch, without the line with the URL, which begins every fetch, and without the identity
  /// of a key, which varies.
  Lines lines() const {
    Lines all;
    for (auto [level, line] : log.lines()) {
      if (line.find("Storebag Server URL") != std::string::npos) continue;
      const auto number = line.find("verified, 0x");
      if (number != std::string::npos && line.find_first_not_of("0123456789abcdef", number + 12) == line.npos)
        line.resize(number + 12);
      all.emplace_back(level, line);
    }
    return all;
  }

  CapturedLog log;
  HTTPClient http;
  LibraryFacts library{"7.3", [] { return PublicKeys{_key->publicKeyInfo()}; }};
  std::unique_ptr<KeptStorebags> kept;  // none unless a test keeps storebags
  std::int32_t maxAge = -1;
  std::optional<std::string> version;
  bool notModified = false;
  std::optional<std::string> lastModified;

 private:
  static inline RecordingServer* _server = nullptr;
  static inline TestSigningKey* _key = nullptr;
};

}  // namespace vesk::test
