// The process's HTTP client, with a shared connection pool and its own thread.
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

#include "platform/http/PostBudget.h"
#include "platform/http/PostKeeper.h"
#include "platform/sync/Mutex.h"

namespace vesk {

struct HTTPRequest {
  /// Whether the client tries again if the transport fails without an answer.
  enum class Retry : unsigned char {
    Never,      ///< uploads and storebag fetches
    UntilSent,  ///< posts: with growing, jittered waits, also if the server's certificate could not be
                ///< verified; for `Options::retryFor`, then the post goes to the keeper or fails
  };

  std::string method = "GET";
  std::string url;  ///< http or https only
  /// Sent in this order. Names must be tokens, and values must not contain control characters; other headers
  /// are left out and logged. Adds only Host, User-Agent, Accept and Content-Length, unless given.
  std::vector<std::pair<std::string, std::string>> headers;
  std::string body;
  /// From `start` to the last byte; for a post that may be retried, from the start of each attempt.
  std::chrono::milliseconds timeout{60'000};
  /// A request that moves fewer bytes per second, counting both directions, for `slowFor` fails as timed out.
  /// 0: it may stall until its timeout.
  long leastBytesPerSecond = 0;
  std::chrono::seconds slowFor{120};
  Retry retry = Retry::Never;
  /// The user that the post belongs to, or kNobody. Owners take turns and share the memory for waiting posts.
  std::uint32_t owner = kNobody;
  /// The sender's account, charged for a post that waits for a server that answers. Null: nothing is charged.
  std::shared_ptr<PostAccount> account{};
  /// Sent over at most two connections to the host, and only when no other request to it waits.
  bool isBackground = false;

  // What a keeper must know about a post.
  std::string source;            ///< the backend that made it
  std::uint32_t events = 1;      ///< the number of events that it holds
  bool respectsConsent = false;  ///< deleted if the user withdraws consent before it is sent

  static constexpr std::uint32_t kNobody = 0xffffffff;
};

struct HTTPResponse {
  long status = 0;  ///< 100 to 599
  std::vector<std::pair<std::string, std::string>> headers;
  /// At most `HTTPClient::Options::maximumBody` bytes. A longer answer is a transport error.
  std::string body;

  /// The value of the first header with that name, ignoring case.
  std::optional<std::string_view> header(std::string_view name) const;
  /// Whether the status says that the server can't do its work at the moment (429, 5xx).
  bool isBusyOrBroken() const { return status == 429 || (status >= 500 && status <= 599); }
};

/// A failure of the transport: there is no complete answer.
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
  bool deferred = false;  ///< the client's keeper has the post and sends it later
};

/// Without an error, there is a response. With an error, there is a response without a body if the server's
/// status had arrived, since the status decides about the request.
struct HTTPResult {
  std::optional<HTTPResponse> response;
  std::optional<HTTPError> error;
};

/// Sends requests. Thread-safe. Verifies TLS certificates against the system's authorities or, if set, the
/// file named by SSL_CERT_FILE. Doesn't follow redirects or cache responses.
class HTTPClient {
 public:
  /// Runs once per request, on the client's thread. Must neither block nor throw. It may move from the
  /// result. Its captures are destroyed on that thread right after it ran.
  using Completion = std::function<void(HTTPResult)>;

  struct Options {
    std::string userAgent = "veskreportingd";
    std::size_t maximumBody = std::size_t{4} << 20;  ///< bytes of a response body
    /// Limit, in bytes, on the bodies of posts that wait during an outage. When the limit or `maximumMemory`
    /// is reached, the owner with the most data waiting for a host loses posts to an owner with less.
    std::size_t maximumWaiting = std::size_t{8} << 20;
    std::size_t maximumMemory = std::size_t{64} << 20;  ///< limit in bytes for all waiting posts
    /// Takes the posts that would otherwise be lost, also when the client ends. Null: they fail.
    PostKeeper* keeper = nullptr;
    /// Sends a post only after the keeper has written a copy of it.
    bool keepsFirst = false;
    /// From the first attempt of a post, or from its start for one that waits behind others.
    std::chrono::milliseconds retryFor{60'000};
    std::chrono::milliseconds firstRetryAfter{200};  ///< doubles each time, up to 10 s, with ±50 % jitter
    std::chrono::milliseconds connectTimeout{15'000};
    /// A post without TCP acknowledgements for this long is sent again on another connection: after a change
    /// of network, kept connections are dead but report no error.
    std::chrono::milliseconds acknowledgedWithin{20'000};
    /// Limit on connections to one host; further requests wait in order. Posts leave one connection to other
    /// requests, so that a fetch does not wait behind posts.
    std::size_t maximumConnectionsPerHost = 8;
    /// Called on any thread whenever the last outstanding request has ended. Must neither block nor throw.
    std::function<void()> onIdle = nullptr;
  };

  /// The thread and the libraries it needs are started with the first request, since an idle daemon should
  /// use little memory.
  explicit HTTPClient(Options options);
  HTTPClient();
  /// Stops.
  ~HTTPClient();
  HTTPClient(const HTTPClient&) = delete;
  HTTPClient& operator=(const HTTPClient&) = delete;

  /// Doesn't block. An owner's posts to one host are sent in the order of the calls as far as connections
  /// allow. If the thread can't be started or memory runs out, the completion runs within this call.
  void start(HTTPRequest request, Completion completion);

  /// For the keeper: copies of posts were written, so these posts may be sent. Doesn't block.
  void keptPostsWereWritten();

  /// Starts the request and blocks until it is completed. Must not be called from a completion.
  HTTPResult perform(HTTPRequest request);

  /// From now on fails all requests except posts with the error `Stopped`, including new ones, so that a
  /// server that hangs delays no one. Posts continue. Those that wait for a host to come back go to the
  /// keeper, or are tried immediately if there is none. Doesn't block.
  void stopAllButPosts();

  /// Fails outstanding requests with `Stopped`, running their completions, and ends the thread. Posts go to
  /// the keeper. From now on, requests fail in the same way within `start`. May be called more than once, but
  /// not from a completion.
  void stop();

  /// Waits up to `timeout` for all requests to end. Returns true if none is outstanding.
  [[nodiscard]] bool waitUntilIdle(std::chrono::milliseconds timeout);

 private:
  class Worker;
  Worker* worker();
  /// Null after `stop`, if there was no worker.
  Worker* startedWorker();

  const Options _options;
  const std::optional<std::string> _authorities;
  std::atomic<bool> _postsOnly{false};
  Mutex _mutex;
  bool _stopped VESK_GUARDED_BY(_mutex) = false;
  std::unique_ptr<Worker> _worker VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
