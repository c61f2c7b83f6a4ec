// The requests and answers of the development collector's HTTP server.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace vesk {

using HTTPHeaderList = std::vector<std::pair<std::string, std::string>>;

/// The value of the first header with that name, ignoring case.
std::optional<std::string_view> findHeader(const HTTPHeaderList& headers, std::string_view name);

/// A complete request.
struct HTTPReceived {
  std::string method;
  std::string target;      ///< as sent: path and query
  HTTPHeaderList headers;  ///< in the original order and spelling
  std::string body;        ///< as sent, possibly compressed
  std::string peer;        ///< "127.0.0.1:40312"

  std::optional<std::string_view> header(std::string_view name) const { return findHeader(headers, name); }
  /// The target without its query.
  std::string_view path() const;
  /// The value of a query parameter, as sent.
  std::optional<std::string_view> query(std::string_view name) const;

  struct Decoded {
    std::optional<std::string> body;
    std::string problem;  ///< readable reason if there is no body
  };
  /// The decompressed body (Content-Encoding "gzip" or none), at most `limit` bytes.
  Decoded decodedBody(std::size_t limit = std::size_t{64} << 20) const;
};

/// An answer, and the fault to deliver it with.
struct HTTPAnswer {
  enum class Fault : unsigned char {
    None,
    Stall,               ///< never answers; the connection stays open until the peer or `stop` ends it
    ResetBeforeAnswer,   ///< TCP reset instead of an answer
    ResetMidAnswer,      ///< TCP reset after the head and half of the body
    CloseWithoutAnswer,  ///< ends the stream instead of answering
    CloseAfterAnswer,    ///< a complete answer that promises keep-alive, then the end of the stream
    CloseMidAnswer,      ///< ends the stream after the head and half of the body
    SlowBody,            ///< the head at once, then the body in ten pieces with `pause` before each
    Garbage,             ///< bytes that are not HTTP, then the end of the stream
    HugeBody,            ///< a gigabyte instead of the body
  };

  unsigned status = 200;
  /// Content-Length is added where HTTP requires it. "Connection: close" ends the connection after the
  /// answer.
  HTTPHeaderList headers;
  std::string body;
  Fault fault = Fault::None;
  std::chrono::milliseconds pause{50};

  /// A plain-text answer with one line.
  static HTTPAnswer text(unsigned status, std::string_view line);
  /// A good answer with that body.
  static HTTPAnswer of(std::string type, std::string body) {
    return {.headers = {{"Content-Type", std::move(type)}}, .body = std::move(body)};
  }
};

/// The head of an answer (status line, headers, empty line) for a body of `length` bytes.
std::string answerHead(const HTTPAnswer& answer, std::uint64_t length, bool keepAlive);
/// Whether HTTP allows a body with that status.
bool mayHaveBody(unsigned status);

}  // namespace vesk
