// What the development collector's HTTP server hands to its handler, and what it gets back.
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

/// The first header of that name, compared without regard to case.
std::optional<std::string_view> findHeader(const HTTPHeaderList& headers, std::string_view name);

/// One request, read to its last byte.
struct HTTPReceived {
  std::string method;
  std::string target;          ///< as sent: path and query
  HTTPHeaderList headers;      ///< in the order and spelling in which they were sent
  std::string body;            ///< as sent, possibly compressed
  std::string peer;            ///< "127.0.0.1:40312"
  std::size_t connection = 0;  ///< 1 for the first accepted connection; the same for all requests on it

  std::optional<std::string_view> header(std::string_view name) const { return findHeader(headers, name); }
  /// The target up to its query.
  std::string_view path() const;
  /// The value of a query parameter, as sent.
  std::optional<std::string_view> query(std::string_view name) const;

  struct Decoded {
    std::optional<std::string> body;
    std::string problem;  ///< why there is none, for a person
  };
  /// The body without its Content-Encoding ("gzip" or none), at most `limit` bytes of it.
  Decoded decodedBody(std::size_t limit = std::size_t{64} << 20) const;
};

/// One answer, and how badly to deliver it.
struct HTTPAnswer {
  enum class Fault : unsigned char {
    None,
    Stall,               ///< never answers; the connection stays open until the peer or `stop` ends it
    Hold,                ///< answers when `HTTPServer::releaseHeld` is called
    ResetBeforeAnswer,   ///< TCP reset instead of an answer
    ResetMidAnswer,      ///< TCP reset after the head and half of the body
    CloseWithoutAnswer,  ///< ends the stream instead of answering
    CloseAfterAnswer,    ///< a whole answer that promises keep-alive, then the end of the stream
    CloseMidAnswer,      ///< ends the stream after the head and half of the body
    SlowBody,            ///< the head at once, the body in ten pieces, `pause` before each
    Garbage,             ///< bytes that are no HTTP, then the end of the stream
    HugeBody,            ///< `hugeBody` bytes instead of the body
  };

  unsigned status = 200;
  /// Content-Length is added where HTTP has one. "Connection: close" ends the connection after the answer.
  HTTPHeaderList headers;
  std::string body;
  Fault fault = Fault::None;
  std::chrono::milliseconds pause{50};
  std::uint64_t hugeBody = std::uint64_t{1} << 30;

  /// A line of text, for a person.
  static HTTPAnswer text(unsigned status, std::string_view line);
};

/// The bytes of an answer: the head (status line, headers, empty line) for a body of `length` bytes.
std::string answerHead(const HTTPAnswer& answer, std::uint64_t length, bool keepAlive);
/// Whether HTTP lets an answer of that status have a body.
bool mayHaveBody(unsigned status);

}  // namespace vesk
