#include "platform/files/FileURL.h"

namespace vesk {

namespace {

int hexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

}  // namespace

std::string pathFromFileURL(std::string_view url) {
  constexpr std::string_view kScheme = "file:";
  if (!url.starts_with(kScheme)) return std::string(url);
  url.remove_prefix(kScheme.size());
  if (url.starts_with("//")) {
    url.remove_prefix(2);
    auto slash = url.find('/');
    auto host = url.substr(0, slash);
    if (slash == std::string_view::npos || (!host.empty() && host != "localhost")) return {};
    url.remove_prefix(slash);
  }
  std::string path;
  for (std::size_t i = 0; i < url.size(); ++i) {
    int high = url[i] == '%' && i + 2 < url.size() ? hexDigit(url[i + 1]) : -1;
    int low = high >= 0 ? hexDigit(url[i + 2]) : -1;
    char c = low >= 0 ? static_cast<char>(high * 16 + low) : url[i];
    if (low >= 0) i += 2;
    if (c == '\0') return {};
    path += c;
  }
  return path;
}

}  // namespace vesk
