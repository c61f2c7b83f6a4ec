// Which request goes out next: the queues of each host, and the posts that wait for another attempt.
#pragma once

#include <cstddef>
#include <cstdint>
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

  /// Brings back the posts whose wait is over, gives up the requests whose time ran out in a queue, and
  /// forgets the hosts that nothing is to be sent to.
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
  /// Posts that wait for another attempt have it next.
  void retryNow() noexcept;
  /// Gives up, with `Stopped`, all that waits, for the end.
  void stopAll() noexcept;

  /// When `advance` has something to do next; nothing when only events from outside can change anything.
  std::optional<Instant> nextAdvance() const noexcept;

 private:
  /// An owner's posts to a host. It is kept as long as the host, so that a post can always come back to it.
  struct Lane {
    HTTPQueue posts;
    std::size_t bodies = 0;  ///< bytes of those in `posts` and `_retries`
    std::size_t cost = 0;    ///< and their memory
  };
  /// Its posts in `_retries` wait because of its outage.
  struct Host {
    HTTPQueue requests;
    std::map<std::uint32_t, Lane> lanes;  ///< by owner
    std::uint32_t lastServed = 0;         ///< owner
    std::size_t queuedPosts = 0;
    std::size_t active = 0;
    std::size_t activePosts = 0;
    std::optional<HTTPError> outage;  ///< how the last attempt failed, until there is an answer again
  };
  using Hosts = std::map<std::string, Host, std::less<>>;
  using Retries = std::multimap<Instant, Exchange>;
  using Measure = std::size_t (*)(const Host&, const Lane&) noexcept;

  static std::size_t memory(const Host& host, const Lane& lane) noexcept;
  /// Bytes of bodies that wait for their host to come back.
  static std::size_t waitingBodies(const Host& host, const Lane& lane) noexcept;
  static bool isUnused(const Hosts::value_type& entry) noexcept;

  /// With the lane of a post. Null when there is no memory for new ones.
  Host* hostFor(const HTTPExchange& exchange) noexcept;
  /// Of an exchange that the schedule has taken.
  Host& hostOf(const HTTPExchange& exchange) noexcept;
  static Lane& laneOf(Host& host, const HTTPExchange& exchange) noexcept;

  /// It is counted in its lane already.
  static void queueFirst(Host& host, Exchange post) noexcept;
  /// Null when none is queued.
  static Exchange takePost(Host& host) noexcept;
  static Exchange takePost(Host& host, Lane& lane) noexcept;
  void bringBack(Host& host) noexcept;

  /// Whether so much more fits into `bound`, when fuller lanes give way to this one.
  bool makeRoom(Measure measure, const Host& host, const Lane& lane, std::size_t size,
                std::size_t bound) noexcept;
  void dropOne(Host& host, Lane& lane) noexcept;

  void release(Host& host, const HTTPExchange& exchange) noexcept;
  void beginOutage(Host& host, const HTTPExchange& exchange, const HTTPError& error, Instant now) noexcept;
  /// Whether `exchange` was taken, to be tried again.
  bool keepForRetry(Host& host, Exchange& exchange, Instant now) noexcept;

  const RetryPolicy _policy;
  const std::size_t _maximumWaiting;
  const std::size_t _maximumMemory;
  const std::size_t _maximumActive;
  const std::size_t _maximumActivePosts;
  std::minstd_rand _random;

  Hosts _hosts;
  Retries _retries;
};

}  // namespace vesk
