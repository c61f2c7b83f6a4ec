#include "tools/collector/HTTPMessage.h"

#include <zlib.h>

#include <algorithm>
#include <array>

#include "platform/text/ASCII.h"

namespace vesk {

namespace {

std::string_view reasonOf(unsigned status) {
  struct Reason {
    unsigned status;
    std::string_view text;
  };
  static constexpr std::array kReasons{
      Reason{200, "OK"},
      Reason{201, "Created"},
      Reason{202, "Accepted"},
      Reason{204, "No Content"},
      Reason{304, "Not Modified"},
      Reason{400, "Bad Request"},
      Reason{401, "Unauthorized"},
      Reason{403, "Forbidden"},
      Reason{404, "Not Found"},
      Reason{405, "Method Not Allowed"},
      Reason{413, "Content Too Large"},
      Reason{431, "Request Header Fields Too Large"},
      Reason{500, "Internal Server Error"},
      Reason{502, "Bad Gateway"},
      Reason{503, "Service Unavailable"},
      Reason{504, "Gateway Timeout"},
  };
  const auto* found = std::find_if(kReasons.begin(), kReasons.end(),
                                   [&](const Reason& reason) { return reason.status == status; });
  return found == kReasons.end() ? "Status" : found->text;
}

/// Inflates a single gzip member, which must span all of `compressed`.
class Inflater {
 public:
  Inflater() {
    constexpr int kGzipOnly = 16 + MAX_WBITS;
    _ready = ::inflateInit2(&_stream, kGzipOnly) == Z_OK;
  }
  ~Inflater() {
    if (_ready) ::inflateEnd(&_stream);
  }
  Inflater(const Inflater&) = delete;
  Inflater& operator=(const Inflater&) = delete;

  HTTPReceived::Decoded run(std::string_view compressed, std::size_t limit) {
    if (!_ready) return {std::nullopt, "the gzip decoder can't be started"};
    _stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(compressed.data()));  // zlib only reads it
    _stream.avail_in = static_cast<uInt>(compressed.size());
    std::string out;
    std::array<char, 65536> piece;
    while (true) {
      _stream.next_out = reinterpret_cast<Bytef*>(piece.data());
      _stream.avail_out = piece.size();
      int result = ::inflate(&_stream, Z_NO_FLUSH);
      out.append(piece.data(), piece.size() - _stream.avail_out);
      if (out.size() > limit)
        return {std::nullopt, "the body unpacks to more than " + std::to_string(limit) + " bytes"};
      if (result == Z_STREAM_END) break;
      if (result != Z_OK) return {std::nullopt, "the body is no whole gzip stream"};
    }
    if (_stream.avail_in != 0) return {std::nullopt, "bytes follow the gzip stream of the body"};
    return {std::move(out), {}};
  }

 private:
  z_stream _stream{};
  bool _ready = false;
};

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
  return Inflater().run(body, limit);
}

HTTPAnswer HTTPAnswer::text(unsigned status, std::string_view line) {
  HTTPAnswer answer;
  answer.status = status;
  answer.headers = {{"Content-Type", "text/plain; charset=utf-8"}};
  answer.body = std::string(line) + "\n";
  return answer;
}

bool mayHaveBody(unsigned status) { return status >= 200 && status != 204 && status != 304; }

std::string answerHead(const HTTPAnswer& answer, std::uint64_t length, bool keepAlive) {
  std::string head = "HTTP/1.1 " + std::to_string(answer.status) + " ";
  head.append(reasonOf(answer.status)).append("\r\n");
  for (const auto& [name, value] : answer.headers)
    head.append(name).append(": ").append(value).append("\r\n");
  if (mayHaveBody(answer.status))
    head.append("Content-Length: ").append(std::to_string(length)).append("\r\n");
  if (!keepAlive && !findHeader(answer.headers, "Connection")) head.append("Connection: close\r\n");
  return head.append("\r\n");
}

}  // namespace vesk
