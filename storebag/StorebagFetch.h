// Fetches a client family's signed configuration and picks the part that applies to this device.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "platform/http/HTTPClient.h"

namespace vesk {

/// What the client library's installation contributes to a fetch.
struct LibraryFacts {
  std::string version;
  /// The DER bytes of the RSA key that storebags are signed with, when there is one. Asked on each fetch.
  std::function<std::optional<std::string>()> publicKey;
};

/// The age in seconds that a "Cache-Control" header grants a storebag; 86400 when it grants none or is
/// absent.
std::int32_t maxAgeFromCacheControl(std::optional<std::string_view> cacheControl);

/// The GET of a storebag: given up after 15 s, and conditional when the server's last "Last-Modified" value
/// is known.
HTTPRequest storebagRequest(std::string url, const std::optional<std::string>& lastModified);

/// Fetches the storebag `name` and returns its verified payload. Blocks for the request, 15 s at most.
///
/// Outputs are written only where they are known; the caller initialises them. `maxAge`: seconds, whenever a
/// whole answer came. `notModified`: set, never cleared, when the request was conditional and an answer with
/// "Last-Modified" had no body; there is no result then. `lastModified`: null for an unconditional request,
/// else the date to ask with, if any, replaced by that of an answer, also when its storebag proves unusable.
///
/// Nothing when there is no usable storebag; the log says why. When the server can't be reached, the storebag
/// "palvo" is the built-in one.
std::optional<Dictionary> fetchStorebagWithName(HTTPClient& http, const LibraryFacts& library,
                                                std::string_view name, std::int32_t& maxAge,
                                                bool& notModified, std::optional<std::string>* lastModified);

/// The section of a storebag's payload for an environment type. A storebag without a "seed" section gives its
/// "release" section for it. Nothing, and a line of level 3, when there is none; the line shows "(none)" for
/// an environment type without a name.
std::optional<Dictionary> storebagSectionForEnvironment(const Dictionary& payload,
                                                        std::int32_t environmentType,
                                                        std::int32_t clientType);

/// Fetches the storebag of a client type, as above, and returns the section for this device's environment.
/// `maxAge` is what the storebag itself says, when it does; `version` is set together with the result.
std::optional<Dictionary> fetchStorebagForEnvironmentAndClientType(
    HTTPClient& http, const LibraryFacts& library, std::int32_t clientType, std::int32_t& maxAge,
    std::optional<std::string>& version, bool& notModified, std::optional<std::string>* lastModified);

}  // namespace vesk
