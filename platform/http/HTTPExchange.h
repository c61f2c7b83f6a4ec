// One request on its way through the client, from `start` to its completion.
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

/// How many exchanges there are. Thread-safe.
class HTTPOutstanding {
 public:
  /// `becameNone`: as HTTPClient::Options::onIdle.
  explicit HTTPOutstanding(std::function<void()> becameNone = nullptr) : _whenNone(std::move(becameNone)) {}
  void add() noexcept;
  void remove() noexcept;
  /// At most `timeout`; true when there are none.
  bool waitUntilNone(std::chrono::milliseconds timeout);

 private:
  const std::function<void()> _whenNone;
  Mutex _mutex;
  std::condition_variable_any _becameNone;
  std::size_t _count VESK_GUARDED_BY(_mutex) = 0;
};

/// Owned by whoever has it in hand: the client's inbox, the schedule or a transfer. Its completion runs
/// exactly once: when nobody else did it, the destructor does, so that no caller waits for ever.
class HTTPExchange {
 public:
  using Instant = std::chrono::steady_clock::time_point;

  /// Counts among `outstanding`, which must outlive it, until what its completion captured is gone.
  HTTPExchange(HTTPRequest&& wanted, HTTPClient::Completion&& completion, Instant now,
               HTTPOutstanding& outstanding) noexcept;
  ~HTTPExchange();
  HTTPExchange(const HTTPExchange&) = delete;
  HTTPExchange& operator=(const HTTPExchange&) = delete;

  bool isPost() const noexcept { return request.retry == HTTPRequest::Retry::UntilSent; }
  /// Scheme, host and port as they stand in the URL.
  std::string_view host() const noexcept;
  /// When a request that is not retried must be over.
  Instant deadline() const noexcept { return started + request.timeout; }
  std::size_t bodySize() const noexcept { return request.body.size(); }
  /// Memory that it holds while it waits, roughly.
  std::size_t cost() const noexcept { return _cost; }

  void complete(HTTPResult result) noexcept;
  void fail(HTTPError error) noexcept { complete(HTTPResult{std::nullopt, std::move(error)}); }

  HTTPRequest request;
  const Instant started;
  Instant firstAttempt{};  ///< once `attempts` is not 0
  unsigned attempts = 0;
  std::unique_ptr<HTTPExchange> next;  ///< in the queue that it is in

 private:
  const std::size_t _cost;
  const std::uint32_t _user;  // on whose behalf it was made
  HTTPClient::Completion _completion;
  HTTPOutstanding& _outstanding;
};

/// Logs what it throws.
void runCompletion(const HTTPClient::Completion& completion, HTTPResult result) noexcept;

/// An error that can be made when there is no memory for its description, too: it has a short one then.
HTTPError httpError(HTTPError::Kind kind, std::string_view description) noexcept;
inline HTTPError outOfMemory() noexcept { return httpError(HTTPError::Kind::OutOfMemory, "out of memory"); }
inline HTTPError stopped() noexcept { return httpError(HTTPError::Kind::Stopped, "the client was stopped"); }

/// Takes out, with a line in the log, every header that could break the request apart.
void removeUnsafeHeaders(HTTPRequest& request);

}  // namespace vesk
