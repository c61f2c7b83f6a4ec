#include "tools/collector/HTTPMessage.h"

#include <zlib.h>

#include <array>
#include <boost/beast/http/status.hpp>
#include <memory>

#include "platform/text/ASCII.h"

namespace vesk {

namespace beast = boost::beast;

namespace {

/// Unpacks a single gzip member, which must span all of `compressed`.
HTTPReceived::Decoded gunzipped(std::string_view compressed, std::size_t limit) {
  constexpr int kGzipOnly = 16 + MAX_WBITS;
  z_stream stream{};
  if (::inflateInit2(&stream, kGzipOnly) != Z_OK) return {std::nullopt, "the gzip decoder can't be started"};
  const std::unique_ptr<z_stream, decltype(&::inflateEnd)> ending(&stream, &::inflateEnd);
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(compressed.data()));  // zlib only reads it
  stream.avail_in = static_cast<uInt>(compressed.size());
  std::string out;
  std::array<char, 65536> piece;
  for (int result = Z_OK; result != Z_STREAM_END;) {
    stream.next_out = reinterpret_cast<Bytef*>(piece.data());
    stream.avail_out = piece.size();
    result = ::inflate(&stream, Z_NO_FLUSH);
    out.append(piece.data(), piece.size() - stream.avail_out);
    if (out.size() > limit)
      return {std::nullopt, "the body unpacks to more than " + std::to_string(limit) + " bytes"};
    if (result != Z_OK && result != Z_STREAM_END) return {std::nullopt, "the body is no whole gzip stream"};
  }
  if (stream.avail_in != 0) return {std::nullopt, "bytes follow the gzip stream of the body"};
  return {std::move(out), {}};
}

}  // namespace

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
  return gunzipped(body, limit);
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
