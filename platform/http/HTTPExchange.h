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

/// The least wait before a post is sent again that the server may have received whole, and may be processing.
inline constexpr std::chrono::seconds kWaitAfterWholeBody{30};

/// Scheme, host and port as written in the URL.
std::string_view hostOfURL(std::string_view url);

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
  /// `copy`: the keeper's ticket of a copy that must be written before the post is sent, or 0.
  HTTPExchange(HTTPRequest&& wanted, HTTPClient::Completion&& completion, Instant now,
               HTTPOutstanding& outstanding, PostKeeper::Ticket copy = 0);
  ~HTTPExchange();
  HTTPExchange(const HTTPExchange&) = delete;
  HTTPExchange& operator=(const HTTPExchange&) = delete;

  bool isPost() const { return request.retry == HTTPRequest::Retry::UntilSent; }
  /// Scheme, host and port as written in the URL.
  std::string_view host() const { return hostOfURL(request.url); }
  /// The time limit of a request that is not retried.
  Instant deadline() const { return started + request.timeout; }
  std::size_t bodySize() const { return request.body.size(); }
  /// Approximate memory that it uses while it waits.
  std::size_t cost() const { return _cost; }

  /// Takes the post off its sender's account, since it waits for a server that does not answer.
  void discharge();

  void complete(HTTPResult result);
  void fail(HTTPError error) { complete(HTTPResult{std::nullopt, std::move(error)}); }
  /// Fails it. A post goes to `keeper` first, if there is one, to be sent after `delay` at the earliest.
  void giveUp(HTTPError error, PostKeeper* keeper, std::chrono::seconds delay = std::chrono::seconds(0));

  HTTPRequest request;
  const Instant started;
  Instant firstAttempt{};  ///< valid if `attempts` is not 0
  unsigned attempts = 0;
  bool hasCopy;               ///< the keeper was given a copy, which it may have refused
  PostKeeper::Ticket ticket;  ///< of the copy that the keeper holds; 0 if there is none

 private:
  const std::size_t _cost;
  const std::uint32_t _user;  // the user it was made for
  bool _isCharged;
  HTTPClient::Completion _completion;
  HTTPOutstanding& _outstanding;
};

/// Runs the completion and logs its exceptions.
void runCompletion(const HTTPClient::Completion& completion, HTTPResult result);

inline HTTPError stopped() { return {HTTPError::Kind::Stopped, "the client was stopped"}; }

/// Removes, and logs, headers that could break the request's framing.
void removeUnsafeHeaders(HTTPRequest& request);

}  // namespace vesk
