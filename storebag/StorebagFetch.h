// Fetches a client family's signed configuration and picks the section that applies to this device.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "platform/http/HTTPClient.h"
#include "storebag/KeptStorebags.h"
#include "storebag/SignedDocument.h"
#include "storebag/StorebagAcceptance.h"
#include "storebag/StorebagSection.h"

namespace vesk {

/// What a fetch finds out besides the storebag, for operators.
struct FetchFacts {
  long status = 0;       ///< the server's; 0: it did not answer
  std::string origin{};  ///< of the storebag: its URL, or "built in"
  std::string key{};     ///< that verified it, see nameOfPublicKey
};

/// What a fetch uses from the client library's installation.
struct LibraryFacts {
  std::string version;
  /// The keys that storebags may be signed with. Called for each fetch.
  std::function<PublicKeys()> publicKeys;
  /// Checks the optional signed keys. Null: they are not checked.
  StorebagAcceptance* acceptance = nullptr;
  /// If not null, gets what a fetch finds out besides the storebag.
  FetchFacts* facts = nullptr;
};

/// The maximum age in seconds that a "Cache-Control" header gives a storebag; 86400 if the header is absent
/// or has none.
std::int32_t maxAgeFromCacheControl(std::optional<std::string_view> cacheControl);

/// The GET request for a storebag. Its timeout is 15 s. It is conditional if the server's last
/// "Last-Modified" value is given.
HTTPRequest storebagRequest(std::string url, const std::optional<std::string>& lastModified);

/// Fetches the storebag `name` and returns its verified payload. Blocks for up to 15 s.
///
/// Outputs are written only if known, so the caller must initialise them. `maxAge`: seconds, set by every
/// complete answer. `notModified`: set, and never cleared, if the request was conditional and an answer with
/// "Last-Modified" had no body; nullopt is returned then. `lastModified`: null for an unconditional request;
/// otherwise the date to send, if any, which is replaced by the answer's date even if the answer's storebag
/// is unusable.
///
/// Returns nullopt, and logs the reason, if there is no usable storebag. If the server can't be reached, the
/// built-in storebag replaces "palvo".
///
/// `kept`, if there is one, gets each verified document. While it has one of that name, the built-in storebag
/// is not used.
std::optional<Dictionary> fetchStorebagWithName(HTTPClient& http, const LibraryFacts& library,
                                                std::string_view name, std::int32_t& maxAge,
                                                bool& notModified, std::optional<std::string>* lastModified,
                                                const KeptStorebags* kept = nullptr);

/// Fetches the storebag of a client type as above and returns the section for this device's environment.
/// `maxAge` is the storebag's own value if it has one. `version` is set if a section is returned.
std::optional<Dictionary> fetchStorebagForEnvironmentAndClientType(
    HTTPClient& http, const LibraryFacts& library, std::int32_t clientType, std::int32_t& maxAge,
    std::optional<std::string>& version, bool& notModified, std::optional<std::string>* lastModified,
    const KeptStorebags* kept = nullptr);

/// What a kept storebag gives a client type before the first fetch.
struct KeptSection {
  Dictionary section;
  std::optional<std::string> version;
  std::optional<std::string> lastModified;
};

/// Returns nullopt if no storebag is kept for the client type, or if it has no section for this device's
/// environment.
std::optional<KeptSection> keptStorebagForClientType(const KeptStorebags& kept, std::int32_t clientType);

}  // namespace vesk
