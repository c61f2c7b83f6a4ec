#include "tools/collector/HTTPMessage.h"

#include <boost/beast/http/status.hpp>

#include "platform/text/ASCII.h"
#include "tools/files/Gunzip.h"

namespace vesk {

namespace beast = boost::beast;

std::optional<std::string_view> findHeader(const HTTPHeaderList& headers, std::string_view name) {
  for (const auto& [key, value] : headers)
    if (equalsIgnoringASCIICase(key, name)) return value;
  return std::nullopt;
}

std::string_view HTTPReceived::path() const { return std::string_view(target).substr(0, target.find('?')); }

std::optional<std::string_view> HTTPReceived::query(std::string_view name) const {
  std::string_view rest = std::string_view(target).substr(path().size());
  while (!rest.empty()) {
    rest.remove_prefix(1);  // the '?' or '&' before the parameter
    std::string_view parameter = rest.substr(0, rest.find('&'));
    rest.remove_prefix(parameter.size());
    std::string_view key = parameter.substr(0, parameter.find('='));
    if (key != name) continue;
    parameter.remove_prefix(std::min(parameter.size(), key.size() + 1));
    return parameter;
  }
  return std::nullopt;
}

HTTPReceived::Decoded HTTPReceived::decodedBody(std::size_t limit) const {
  auto encoding = header("Content-Encoding");
  if (!encoding || encoding->empty() || equalsIgnoringASCIICase(*encoding, "identity")) {
    if (body.size() > limit)
      return {std::nullopt, "the body has more than " + std::to_string(limit) + " bytes"};
    return {body, {}};
  }
  if (!equalsIgnoringASCIICase(*encoding, "gzip"))
    return {std::nullopt, "Content-Encoding is neither gzip nor absent: " + std::string(*encoding)};
  auto unpacked = gunzipped(body, limit);
  if (!unpacked) return {std::nullopt, unpacked.error().text};
  return {*std::move(unpacked), {}};
}

HTTPAnswer HTTPAnswer::text(unsigned status, std::string_view line) {
  HTTPAnswer answer = of("text/plain; charset=utf-8", std::string(line) + "\n");
  answer.status = status;
  return answer;
}

bool mayHaveBody(unsigned status) { return status >= 200 && status != 204 && status != 304; }

std::string answerHead(const HTTPAnswer& answer, std::uint64_t length, bool keepAlive) {
  std::string head = "HTTP/1.1 " + std::to_string(answer.status) + " ";
  head.append(beast::http::obsolete_reason(static_cast<beast::http::status>(answer.status))).append("\r\n");
  for (const auto& [name, value] : answer.headers)
    head.append(name).append(": ").append(value).append("\r\n");
  if (mayHaveBody(answer.status))
    head.append("Content-Length: ").append(std::to_string(length)).append("\r\n");
  if (!keepAlive && !findHeader(answer.headers, "Connection")) head.append("Connection: close\r\n");
  return head.append("\r\n");
}

}  // namespace vesk
