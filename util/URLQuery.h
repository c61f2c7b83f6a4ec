// What URLs are made of.
#pragma once

#include <string>
#include <string_view>

namespace vesk {

/// `text` with %XX for each byte that may not stand in a URL's query as it is. What separates the parts of a
/// query ("&", "=", "?", "/") may, and stays.
std::string encodedForURLQuery(std::string_view text);

/// `url` with %XX for each byte that no URL may hold: a URL that is well-formed stays as it is.
std::string encodedForURL(std::string_view url);

/// Whether `url` is an absolute http or https URL, spelt with nothing but the characters that URLs are made
/// of.
bool isWebURL(std::string_view url);

}  // namespace vesk
