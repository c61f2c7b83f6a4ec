// Encoding and checking of URLs.
#pragma once

#include <string>
#include <string_view>

namespace vesk {

/// Percent-encodes each byte of `text` that is not allowed in a URL's query. Keeps the characters that
/// structure a query ("&", "=", "?", "/").
std::string encodedForURLQuery(std::string_view text);

/// Percent-encodes each byte of `url` that is not allowed in a URL. A well-formed URL stays unchanged.
std::string encodedForURL(std::string_view url);

/// Whether `url` is an absolute http or https URL that consists only of characters allowed in URLs.
bool isWebURL(std::string_view url);

}  // namespace vesk
