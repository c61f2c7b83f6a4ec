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

std::optional<std::string> percentDecoded(std::string_view text) {
  std::string decoded;
  for (std::size_t i = 0; i < text.size(); ++i) {
    int high = text[i] == '%' && i + 2 < text.size() ? hexDigit(text[i + 1]) : -1;
    int low = high >= 0 ? hexDigit(text[i + 2]) : -1;
    char c = low >= 0 ? static_cast<char>(high * 16 + low) : text[i];
    if (low >= 0) i += 2;
    if (c == '\0') return std::nullopt;
    decoded += c;
  }
  return decoded;
}

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
  return percentDecoded(url).value_or(std::string());
}

}  // namespace vesk
