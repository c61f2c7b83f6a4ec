#include "platform/outbox/RetryAfter.h"

#include <time.h>

#include <algorithm>
#include <charconv>
#include <string>

namespace vesk {

std::optional<std::chrono::seconds> retryAfter(const HTTPResponse& response, WallTime now) {
  const auto header = response.header("Retry-After");
  if (!header) return std::nullopt;
  unsigned seconds = 0;
  const auto [end, error] = std::from_chars(header->data(), header->data() + header->size(), seconds);
  if (error == std::errc() && end == header->data() + header->size()) return std::chrono::seconds(seconds);

  std::tm parts{};
  const std::string text(*header);
  const char* rest = ::strptime(text.c_str(), "%a, %d %b %Y %H:%M:%S GMT", &parts);
  if (!rest || *rest != '\0') return std::nullopt;
  const WallTime date{std::chrono::seconds(::timegm(&parts))};
  return std::max(std::chrono::duration_cast<std::chrono::seconds>(date - now), std::chrono::seconds(0));
}

}  // namespace vesk
