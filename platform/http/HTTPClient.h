// The process's HTTP client: one shared connection pool, one thread of its own.
#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/sync/Mutex.h"

namespace vesk {

struct HTTPRequest {
  /// What the client may do when the transport fails before any answer arrived.
  enum class Retry : unsigned char {
    Never,      ///< uploads and storebag fetches
    UntilSent,  ///< posts: again with growing, jittered waits, for at most 60 s and while fewer than 8 MiB
                ///< wait; also when the server's certificate could not be verified
  };

  std::string method = "GET";
  std::string url;  ///< only http and https are followed
  /// Sent in this order. Names must be tokens and values must not hold control characters (such a header is
  /// left out and logged). Nothing is added but Host, User-Agent, Accept and Content-Length, unless given.
  std::vector<std::pair<std::string, std::string>> headers;
  std::string body;
  /// From `start` to the last byte; for a post that may be retried, from the start of each attempt.
  std::chrono::milliseconds timeout{60'000};
  /// A request that moves fewer bytes than that, to and fro, for as long as `slowFor` is given up as timed
  /// out. 0: it may stand still until its timeout.
  long leastBytesPerSecond = 0;
  std::chrono::seconds slowFor{120};
  Retry retry = Retry::Never;
  /// Whose post it is: a user's number, or any. Owners take turns, and share what may wait.
  std::uint32_t owner = kNobody;

  static constexpr std::uint32_t kNobody = 0xffffffff;
};

struct HTTPResponse {
  long status = 0;  ///< 100 to 599
  std::vector<std::pair<std::string, std::string>> headers;
  /// At most `HTTPClient::Options::maximumBody` bytes; a longer answer is a transport error.
  std::string body;

  /// The first header of that name, compared without regard to case.
  std::optional<std::string_view> header(std::string_view name) const;
};

/// The transport failed: there is no whole answer.
struct HTTPError {
  enum class Kind : unsigned char {
    Connect,
    Resolve,
    Timeout,
    TLS,
    Interrupted,
    BadURL,
    TooLarge,
    OutOfMemory,
    Stopped,
    Other
  };
  Kind kind = Kind::Other;
  std::string description;
};

/// Without an error, there is a response. With one there is a response, without its body, when the server's
/// status had arrived: it decided about the request, whatever became of the rest.
struct HTTPResult {
  std::optional<HTTPResponse> response;
  std::optional<HTTPError> error;
};

/// Sends requests. Thread-safe. TLS certificates are verified against the system's authorities or, when set,
/// the file named by SSL_CERT_FILE. Redirects are not followed; no response is cached.
class HTTPClient {
 public:
  /// Runs once per request, on the client's thread; must neither block nor throw. The result is its own, to
  /// be moved from. What it captured is destroyed on that thread right after it ran.
  using Completion = std::function<void(HTTPResult)>;

  struct Options {
    std::string userAgent = "veskreportingd";
    std::size_t maximumBody = std::size_t{4} << 20;  ///< bytes of a response body
    /// Bytes of post bodies that wait out an outage. When there is no more room, or too little memory, the
    /// owner who has most waiting for a host gives way to one who has less.
    std::size_t maximumWaiting = std::size_t{8} << 20;
    std::size_t maximumMemory = std::size_t{64} << 20;  ///< bytes of memory for all posts that wait
    std::chrono::milliseconds retryFor{60'000};         ///< from the first attempt of a post
    std::chrono::milliseconds firstRetryAfter{200};     ///< doubled each time, up to 10 s, ±50 % jitter
    std::chrono::milliseconds connectTimeout{15'000};
    /// A post whose bytes nobody acknowledges for so long is sent again by another connection: after a change
    /// of network, kept connections are dead and do not tell.
    std::chrono::milliseconds acknowledgedWithin{20'000};
    /// Further requests to that host wait in order. Posts leave one connection to the other requests, so that
    /// a fetch does not wait behind them.
    std::size_t maximumConnectionsPerHost = 8;
    /// Called whenever the last outstanding request has ended, on any thread; must neither block nor throw.
    std::function<void()> onIdle = nullptr;
  };

  /// The thread and the libraries under it, which are large, start with the first request: a daemon that has
  /// nothing to say is small.
  explicit HTTPClient(Options options);
  HTTPClient();
  /// Fails what is still outstanding with `Stopped` (completions run), then ends the thread. Not to be called
  /// from a completion.
  ~HTTPClient();
  HTTPClient(const HTTPClient&) = delete;
  HTTPClient& operator=(const HTTPClient&) = delete;

  /// Returns at once. An owner's posts to one host are sent in the order of the calls as far as connections
  /// allow. When the thread can not be started or there is no memory for the request, the completion runs
  /// within this call.
  void start(HTTPRequest request, Completion completion);

  /// Starts the request and blocks until it is completed. Not to be called from a completion.
  HTTPResult perform(HTTPRequest request);

  /// From now on fails at once, with `Stopped`, what is not to be retried, be it under way, waiting or new: a
  /// server that hangs no longer holds up those who wait for it. Posts go on, and those that wait for another
  /// attempt have it now. Returns at once.
  void stopAllButPosts();

  /// Waits until nothing is outstanding, at most `timeout`; true when nothing was left.
  [[nodiscard]] bool waitUntilIdle(std::chrono::milliseconds timeout);

 private:
  class Worker;
  Worker* worker();
  Worker& startedWorker();

  const Options _options;
  const std::optional<std::string> _authorities;
  std::atomic<bool> _postsOnly{false};
  Mutex _mutex;
  std::unique_ptr<Worker> _worker VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
