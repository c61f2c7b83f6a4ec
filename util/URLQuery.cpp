#include "util/URLQuery.h"

#include <algorithm>

#include "platform/text/ASCII.h"
#include "platform/text/PercentCode.h"

namespace vesk {

namespace {

constexpr std::string_view kOthersInQuery = "!$&'()*+,;=:@/?";
constexpr std::string_view kOthersInURL = "!$&'()*+,;=:@/?#[]%";

bool isIn(std::string_view set, char c) { return set.find(c) != std::string_view::npos; }

/// The part after the scheme if the URL's scheme is `scheme`, ignoring case; otherwise empty.
std::string_view afterScheme(std::string_view url, std::string_view scheme) {
  if (!equalsIgnoringASCIICase(url.substr(0, scheme.size()), scheme)) return {};
  return url.substr(scheme.size());
}

}  // namespace

std::string encodedForURLQuery(std::string_view text) { return percentEncoded(text, kOthersInQuery); }

std::string encodedForURL(std::string_view url) { return percentEncoded(url, kOthersInURL); }

bool isWebURL(std::string_view url) {
  std::string_view rest = afterScheme(url, "http://");
  if (rest.empty()) rest = afterScheme(url, "https://");
  bool hasHost = !rest.empty() && !isIn("/?#:", rest.front());
  return hasHost && std::all_of(rest.begin(), rest.end(),
                                [](char c) { return isIn(kUnreserved, c) || isIn(kOthersInURL, c); });
}

}  // namespace vesk
