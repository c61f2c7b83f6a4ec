#include "util/URLQuery.h"

#include <algorithm>

namespace vesk {

namespace {

constexpr std::string_view kUnreserved = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-._~";
constexpr std::string_view kOthersInQuery = "!$&'()*+,;=:@/?";
constexpr std::string_view kOthersInURL = "!$&'()*+,;=:@/?#[]%";

bool isIn(std::string_view set, char c) { return set.find(c) != std::string_view::npos; }

/// What follows the scheme when that is `scheme`, in letters of either case.
std::string_view afterScheme(std::string_view url, std::string_view scheme) {
  if (url.size() < scheme.size()) return {};
  bool equal = std::equal(scheme.begin(), scheme.end(), url.begin(),
                          [](char wanted, char c) { return wanted == c || wanted == (c | 0x20); });
  return equal ? url.substr(scheme.size()) : std::string_view();
}

}  // namespace

std::string encodedForURLQuery(std::string_view text) {
  constexpr char kDigits[] = "0123456789ABCDEF";
  std::string encoded;
  for (char c : text) {
    if (isIn(kUnreserved, c) || isIn(kOthersInQuery, c)) {
      encoded += c;
    } else {
      auto byte = static_cast<unsigned char>(c);
      encoded += {'%', kDigits[byte >> 4], kDigits[byte & 15]};
    }
  }
  return encoded;
}

bool isWebURL(std::string_view url) {
  std::string_view rest = afterScheme(url, "http://");
  if (rest.empty()) rest = afterScheme(url, "https://");
  bool hasHost = !rest.empty() && !isIn("/?#:", rest.front());
  return hasHost && std::all_of(rest.begin(), rest.end(),
                                [](char c) { return isIn(kUnreserved, c) || isIn(kOthersInURL, c); });
}

}  // namespace vesk
