#include "platform/files/FileURL.h"

#include "platform/text/PercentCode.h"

namespace vesk {

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
