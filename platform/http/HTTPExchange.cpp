#include "platform/http/HTTPExchange.h"

#include <algorithm>
#include <exception>
#include <string>

#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

bool isTokenCharacter(char c) {
  if ((c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z')) return true;
  return c != '\0' && std::string_view("!#$%&'*+-.^_`|~").find(c) != std::string_view::npos;
}

bool isControl(char c) {
  auto byte = static_cast<unsigned char>(c);
  return byte < 0x20 || byte == 0x7f;
}

bool isSafe(const std::pair<std::string, std::string>& header) {
  const auto& [name, value] = header;
  return !name.empty() && std::all_of(name.begin(), name.end(), isTokenCharacter) &&
         std::none_of(value.begin(), value.end(), isControl);
}

}  // namespace

HTTPExchange::~HTTPExchange() {
  if (_completion) fail({HTTPError::Kind::Other, "the client could not take the request"});
}

std::string_view HTTPExchange::host() const noexcept {
  std::string_view url = request.url;
  auto scheme = url.find("://");
  if (scheme == std::string_view::npos) return url;
  return url.substr(0, url.find_first_of("/?#", scheme + 3));
}

void HTTPExchange::complete(const HTTPResult& result) noexcept {
  // What it captured is destroyed with it, here.
  auto completion = std::exchange(_completion, nullptr);
  if (!completion) return;
  try {
    completion(result);
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("HTTPClient: a completion failed: %s", error.what());
  } catch (...) {
    VESK_LOG_ERROR("HTTPClient: a completion failed");
  }
}

void removeUnsafeHeaders(HTTPRequest& request) {
  std::erase_if(request.headers, [](const auto& header) {
    if (isSafe(header)) return false;
    VESK_LOG_WARNING("HTTPClient: header '%s' left out: it holds characters that no header may hold",
                     header.first.c_str());
    return true;
  });
}

}  // namespace vesk
