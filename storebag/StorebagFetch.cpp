#include "storebag/StorebagFetch.h"

#include <algorithm>
#include <chrono>
#include <limits>

#include "platform/log/SystemLog.h"
#include "platform/plist/PropertyList.h"
#include "platform/text/ASCII.h"
#include "storebag/Settings.h"
#include "storebag/StorebagFallback.h"
#include "storebag/StorebagNaming.h"
#include "storebag/StorebagProfile.h"
#include "values/Conversions.h"

namespace vesk {

namespace {

constexpr std::chrono::seconds kTimeout{15};
constexpr std::int32_t kLongestAge = 86400;  // seconds
constexpr std::string_view kFallbackName = "palvo";
constexpr std::string_view kStorebag = "storebag";  // backend name in lines about the storebag's own entries

/// The values of that header, joined if it has several lines; nullopt without the header.
std::optional<std::string> listInHeader(const HTTPResponse& response, std::string_view name) {
  std::optional<std::string> list;
  for (const auto& [each, value] : response.headers) {
    if (!equalsIgnoringASCIICase(each, name)) continue;
    list = list ? *list + ", " + value : value;
  }
  return list;
}

/// Whether the answer says that the caller's storebag is still current. Otherwise stores the answer's date in
/// `lastModified`.
bool hasNotChanged(const HTTPResponse& response, std::optional<std::string>* lastModified) {
  auto received = response.header("Last-Modified");
  if (!lastModified || !received) return false;
  if (response.body.empty() && *lastModified) {
    VESK_LOG_DEBUG("fetchStorebagWithName: storebag content has not changed. using its cached version");
    return true;
  }
  *lastModified = std::string(*received);
  VESK_LOG_DEBUG("fetchStorebagWithName: New 'Last-Modified: %s' received", (*lastModified)->c_str());
  return false;
}

/// The signed document around a storebag; empty if `body` is not such a document.
Dictionary documentIn(const std::string& body) {
  const auto root = parsePropertyList(body);
  if (!root) {
    VESK_LOG_ERROR("fetchStorebagWithName: propertyListWithData error %s", root.error().text.c_str());
    return {};
  }
  const Dictionary* document = root->dictionary();
  return document ? *document : Dictionary();
}

std::optional<Dictionary> verifiedPayload(const Dictionary& document, const LibraryFacts& library,
                                          std::string_view name) {
  using Verdict = Verification::Verdict;
  auto verification =
      verifySignedDocument(document, library.publicKeys ? library.publicKeys() : PublicKeys());
  switch (verification.verdict) {
    case Verdict::Good:
      if (const auto accepted =
              library.acceptance ? library.acceptance->accept(name, verification.payload) : Result<void>();
          !accepted) {
        VESK_LOG_ERROR("fetchStorebagWithName: Storebag '%s' is refused: %s", std::string(name).c_str(),
                       accepted.error().text.c_str());
        break;
      }
      if (library.facts) library.facts->key = verification.key;
      return std::move(verification.payload);
    case Verdict::SignatureMissing:
      VESK_LOG_ERROR("fetchStorebagWithName: Signature is missing");
      break;
    case Verdict::SignatureWrong:
      VESK_LOG_ERROR("fetchStorebagWithName: Signature can not be verified, %p", verification.keyIdentity);
      break;
    case Verdict::Unusable:
      break;
  }
  return std::nullopt;
}

}  // namespace

HTTPRequest storebagRequest(std::string url, const std::optional<std::string>& lastModified) {
  HTTPRequest request;
  request.url = std::move(url);
  request.timeout = kTimeout;
  if (lastModified) {
    VESK_LOG_DEBUG("fetchStorebagWithName: Adding 'Last-Modified: %s' to the header", lastModified->c_str());
    request.headers.emplace_back("If-Modified-Since", *lastModified);
  }
  return request;
}

std::int32_t maxAgeFromCacheControl(std::optional<std::string_view> cacheControl) {
  std::string_view rest = cacheControl.value_or("");
  for (bool found = false;;) {
    auto end = rest.find_first_of("= ");
    auto token = rest.substr(0, end);
    if (found) {
      using Age = std::numeric_limits<std::int32_t>;
      return static_cast<std::int32_t>(
          std::clamp<std::int64_t>(leadingInteger(token), Age::min(), Age::max()));
    }
    found = token == "max-age";
    if (end == std::string_view::npos) return kLongestAge;
    rest.remove_prefix(end + 1);
  }
}

std::optional<Dictionary> fetchStorebagWithName(HTTPClient& http, const LibraryFacts& library,
                                                std::string_view name, std::int32_t& maxAge,
                                                bool& notModified, std::optional<std::string>* lastModified,
                                                const KeptStorebags* kept) {
  std::string url = storebagServerBaseURL();
  ((url += '/') += name) += "?version=";
  url += library.version;
  VESK_LOG_DEBUG("fetchStorebagWithName: Storebag Server URL: %s", url.c_str());

  HTTPResult result = http.perform(storebagRequest(url, lastModified ? *lastModified : std::nullopt));
  if (result.error && result.error->kind == HTTPError::Kind::TooLarge) {
    // The server answered, but not with a storebag.
    VESK_LOG_ERROR("fetchStorebagWithName: propertyListWithData error %s", result.error->description.c_str());
    return verifiedPayload({}, library, name);
  }
  if (result.error) {
    VESK_LOG_INFO(
        "fetchStorebagWithName: Error resolving with lookup server %s, sendSynchronousRequest error %s",
        url.c_str(), result.error->description.c_str());
    // While the daemon ends, no client should start with less than the server would give it.
    if (name != kFallbackName || result.error->kind == HTTPError::Kind::Stopped) return std::nullopt;
    // The caller has the kept storebag already.
    if (kept && kept->load(name)) return std::nullopt;
    VESK_LOG_INFO("fetchStorebagWithName: Loading default storebag '%s'", std::string(name).c_str());
    if (library.acceptance) library.acceptance->usesBuiltIn(name);
    if (library.facts) library.facts->origin = "built in";
    return fallbackStorebag();
  }
  if (library.facts) library.facts->status = result.response->status;
  maxAge = maxAgeFromCacheControl(listInHeader(*result.response, "Cache-Control"));
  if (hasNotChanged(*result.response, lastModified)) {
    notModified = true;
    return std::nullopt;
  }
  auto payload = verifiedPayload(documentIn(result.response->body), library, name);
  if (payload && library.facts) library.facts->origin = url;
  if (payload && kept) kept->keep(name, result.response->body, lastModified ? *lastModified : std::nullopt);
  return payload;
}

std::optional<Dictionary> fetchStorebagForEnvironmentAndClientType(
    HTTPClient& http, const LibraryFacts& library, std::int32_t clientType, std::int32_t& maxAge,
    std::optional<std::string>& version, bool& notModified, std::optional<std::string>* lastModified,
    const KeptStorebags* kept) {
  auto name = storebagNameForClientType(clientType);
  if (!name) {
    VESK_LOG_ERROR(
        "fetchStorebagForEnvironmentAndClientType: Could not find storebag name for client type %d",
        clientType);
    return std::nullopt;
  }
  auto payload = fetchStorebagWithName(http, library, *name, maxAge, notModified, lastModified, kept);
  if (!payload) {
    if (notModified) return std::nullopt;
    VESK_LOG_ERROR("fetchStorebagForEnvironmentAndClientType: Could not fetch storebag for client type %d",
                   clientType);
    return std::nullopt;
  }
  auto section = storebagSectionForEnvironment(*payload, currentEnvironmentType(), clientType);
  if (!section) return std::nullopt;
  version = profileText(kStorebag, *payload, "version");
  if (auto cycle = profileInteger(kStorebag, *payload, "refresh_cycle")) {
    maxAge = static_cast<std::int32_t>(
        std::clamp<std::int64_t>(*cycle, std::numeric_limits<std::int32_t>::min(), kLongestAge));
    VESK_LOG_INFO("fetchStorebagForEnvironmentAndClientType: Store bag override MaxAge=%d", maxAge);
  }
  return section;
}

std::optional<KeptSection> keptStorebagForClientType(const KeptStorebags& kept, std::int32_t clientType) {
  const auto name = storebagNameForClientType(clientType);
  auto storebag = name ? kept.load(*name) : std::nullopt;
  if (!storebag) return std::nullopt;
  auto section = storebagSectionForEnvironment(storebag->payload, currentEnvironmentType(), clientType);
  if (!section) return std::nullopt;
  return KeptSection{*std::move(section), profileText(kStorebag, storebag->payload, "version"),
                     std::move(storebag->lastModified)};
}

}  // namespace vesk
