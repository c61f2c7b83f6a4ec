// One request within the client, from `start` to its completion.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <functional>
#include <memory>
#include <string_view>
#include <utility>

#include "platform/http/HTTPClient.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// Counts the exchanges. Thread-safe.
class HTTPOutstanding {
 public:
  /// `becameNone`: see HTTPClient::Options::onIdle.
  explicit HTTPOutstanding(std::function<void()> becameNone = nullptr) : _whenNone(std::move(becameNone)) {}
  void add() noexcept;
  void remove() noexcept;
  /// Waits up to `timeout`. Returns true if there are none.
  bool waitUntilNone(std::chrono::milliseconds timeout);

 private:
  const std::function<void()> _whenNone;
  Mutex _mutex;
  std::condition_variable_any _becameNone;
  std::size_t _count VESK_GUARDED_BY(_mutex) = 0;
};

/// Owned by the client's inbox, the schedule or a transfer. Its completion runs exactly once, by the
/// destructor if necessary, so that no caller waits for ever.
class HTTPExchange {
 public:
  using Instant = std::chrono::steady_clock::time_point;

  /// Counted by `outstanding`, which must outlive it, until the completion's captures are destroyed.
  HTTPExchange(HTTPRequest&& wanted, HTTPClient::Completion&& completion, Instant now,
               HTTPOutstanding& outstanding) noexcept;
  ~HTTPExchange();
  HTTPExchange(const HTTPExchange&) = delete;
  HTTPExchange& operator=(const HTTPExchange&) = delete;

  bool isPost() const noexcept { return request.retry == HTTPRequest::Retry::UntilSent; }
  /// Scheme, host and port as written in the URL.
  std::string_view host() const noexcept;
  /// The time limit of a request that is not retried.
  Instant deadline() const noexcept { return started + request.timeout; }
  std::size_t bodySize() const noexcept { return request.body.size(); }
  /// Approximate memory that it uses while it waits.
  std::size_t cost() const noexcept { return _cost; }

  void complete(HTTPResult result) noexcept;
  void fail(HTTPError error) noexcept { complete(HTTPResult{std::nullopt, std::move(error)}); }

  HTTPRequest request;
  const Instant started;
  Instant firstAttempt{};  ///< valid if `attempts` is not 0
  unsigned attempts = 0;
  std::unique_ptr<HTTPExchange> next;  ///< in its queue

 private:
  const std::size_t _cost;
  const std::uint32_t _user;  // the user it was made for
  HTTPClient::Completion _completion;
  HTTPOutstanding& _outstanding;
};

/// Runs the completion and logs its exceptions.
void runCompletion(const HTTPClient::Completion& completion, HTTPResult result) noexcept;

/// Creates an error. If memory runs out, its description becomes a short one.
HTTPError httpError(HTTPError::Kind kind, std::string_view description) noexcept;
inline HTTPError outOfMemory() noexcept { return httpError(HTTPError::Kind::OutOfMemory, "out of memory"); }
inline HTTPError stopped() noexcept { return httpError(HTTPError::Kind::Stopped, "the client was stopped"); }

/// Removes, and logs, headers that could break the request's framing.
void removeUnsafeHeaders(HTTPRequest& request);

}  // namespace vesk
