// Which request goes out next: the queues of each host, and the posts that wait for another attempt.
#pragma once

#include <cstddef>
#include <deque>
#include <map>
#include <memory>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include "platform/http/HTTPExchange.h"
#include "platform/http/RetryPolicy.h"

namespace vesk {

/// Owns every exchange that is not being transferred. Used by the client's thread only; reads no clock.
class HTTPSchedule {
 public:
  using Instant = HTTPExchange::Instant;
  using Exchange = std::unique_ptr<HTTPExchange>;
  struct GivenUp {
    Exchange exchange;
    HTTPError error;
  };

  explicit HTTPSchedule(const HTTPClient::Options& options);

  /// Queues a new exchange, or gives it up at once when too much waits already.
  void add(Exchange exchange);

  /// Brings back the posts whose wait is over and gives up the requests whose time ran out in a queue.
  void advance(Instant now);

  /// The next exchange that a connection is free for, or null. It counts against its host until `answered` or
  /// `failed` is called with it.
  Exchange next(Instant now);

  void answered(const HTTPExchange& exchange);

  /// The transport failed. Keeps the exchange when `mayRetry` and the retry policy allow another attempt, and
  /// gives it up else.
  void failed(Exchange exchange, HTTPError error, bool mayRetry, Instant now);

  /// What was given up since the last call; the caller completes it.
  std::vector<GivenUp> takeGivenUp();
  /// Everything, for the end.
  std::vector<Exchange> takeAll();

  /// When `advance` has something to do next; nothing when only events from outside can change anything.
  std::optional<Instant> nextAdvance() const;

 private:
  struct Host {
    std::deque<Exchange> requests;
    std::deque<Exchange> posts;
    std::size_t postBytes = 0;  ///< of the bodies in `posts`
    std::size_t active = 0;
    std::size_t activePosts = 0;
    std::size_t retrying = 0;         ///< its posts in `_retries`
    std::optional<HTTPError> outage;  ///< how the last attempt failed, until there is an answer again
  };
  using Hosts = std::map<std::string, Host, std::less<>>;

  Host& hostOf(const HTTPExchange& exchange);
  void release(Host& host, const HTTPExchange& exchange);
  void forgetIfUnused(std::string_view name);
  void queuePost(Host& host, Exchange exchange, bool first);
  Exchange takePost(Host& host);
  void giveUp(Exchange exchange, HTTPError error);
  void giveUpOverdue(Host& host, const HTTPError& error, Instant now);
  /// Bytes of the bodies that wait for their host to come back.
  std::size_t waiting() const;

  const RetryPolicy _policy;
  const std::size_t _maximumQueued;
  const std::size_t _maximumActive;
  const std::size_t _maximumActivePosts;
  std::minstd_rand _random;

  Hosts _hosts;
  std::multimap<Instant, Exchange> _retries;
  std::size_t _retryBytes = 0;  ///< of the bodies in `_retries`
  std::size_t _queuedCost = 0;  ///< of all posts in queues
  std::vector<GivenUp> _givenUp;
};

}  // namespace vesk
