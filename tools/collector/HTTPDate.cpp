#include "tools/collector/HTTPDate.h"

namespace vesk {

namespace {
// Names of days and months are English because the program never sets a locale.
constexpr char kFormat[] = "%a, %d %b %Y %H:%M:%S GMT";
}  // namespace

std::string httpDate(std::time_t time) {
  std::tm calendar{};
  ::gmtime_r(&time, &calendar);
  char text[64];
  return std::string(text, std::strftime(text, sizeof text, kFormat, &calendar));
}

std::optional<std::time_t> timeFromHTTPDate(std::string_view text) {
  std::string terminated(text);
  std::tm calendar{};
  const char* end = ::strptime(terminated.c_str(), kFormat, &calendar);
  if (end == nullptr || *end != '\0') return std::nullopt;
  return ::timegm(&calendar);
}

}  // namespace vesk
