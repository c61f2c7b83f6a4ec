// Which request goes out next: the queues of each host, and the posts that wait for another attempt.
#pragma once

#include <cstddef>
#include <map>
#include <optional>
#include <random>
#include <string>
#include <string_view>

#include "platform/http/HTTPExchange.h"
#include "platform/http/HTTPQueue.h"
#include "platform/http/RetryPolicy.h"

namespace vesk {

/// Owns every exchange that is not being transferred. What is given up is completed there and then. Used by
/// the client's thread only; reads no clock. Without memory it gives up the exchange that it has none for.
class HTTPSchedule {
 public:
  using Instant = HTTPExchange::Instant;
  using Exchange = HTTPQueue::Exchange;

  explicit HTTPSchedule(const HTTPClient::Options& options);

  /// Queues a new exchange, or gives it up at once when too much waits already.
  void add(Exchange exchange) noexcept;

  /// Brings back the posts whose wait is over and gives up the requests whose time ran out in a queue.
  void advance(Instant now) noexcept;

  /// The next exchange that a connection is free for, or null. It counts against its host until `answered` or
  /// `failed` is called with it.
  Exchange next(Instant now) noexcept;

  void answered(const HTTPExchange& exchange) noexcept;

  /// The transport failed. Keeps the exchange when `mayRetry` and the retry policy allow another attempt, and
  /// gives it up else.
  void failed(Exchange exchange, HTTPError error, bool mayRetry, Instant now) noexcept;

  /// Gives up, with `Stopped`, all that waits and is no post.
  void stopAllButPosts() noexcept;
  /// Gives up, with `Stopped`, all that waits, for the end.
  void stopAll() noexcept;

  /// When `advance` has something to do next; nothing when only events from outside can change anything.
  std::optional<Instant> nextAdvance() const noexcept;

 private:
  struct Host {
    HTTPQueue requests;
    HTTPQueue posts;
    std::size_t postBytes = 0;  ///< of the bodies in `posts`
    std::size_t active = 0;
    std::size_t activePosts = 0;
    std::size_t retrying = 0;         ///< its posts in `_retries`
    std::optional<HTTPError> outage;  ///< how the last attempt failed, until there is an answer again
  };
  using Hosts = std::map<std::string, Host, std::less<>>;

  /// Null when there is no memory for a new one.
  Host* hostFor(const HTTPExchange& exchange) noexcept;
  /// Of an exchange that counts against its host.
  Host& hostOf(const HTTPExchange& exchange) noexcept;
  void release(Host& host, const HTTPExchange& exchange) noexcept;
  void forgetIfUnused(std::string_view name) noexcept;
  void queuePost(Host& host, Exchange exchange, bool first) noexcept;
  Exchange takePost(Host& host) noexcept;
  void beginOutage(Host& host, const HTTPExchange& exchange, const HTTPError& error, Instant now) noexcept;
  /// Whether `exchange` was taken, to be tried again.
  bool keepForRetry(Host& host, Exchange& exchange, Instant now) noexcept;
  /// Bytes of the bodies that wait for their host to come back.
  std::size_t waiting() const noexcept;

  const RetryPolicy _policy;
  const std::size_t _maximumQueued;
  const std::size_t _maximumActive;
  const std::size_t _maximumActivePosts;
  std::minstd_rand _random;

  Hosts _hosts;
  std::multimap<Instant, Exchange> _retries;
  std::size_t _retryBytes = 0;  ///< of the bodies in `_retries`
  std::size_t _queuedCost = 0;  ///< of all posts in queues
};

}  // namespace vesk
