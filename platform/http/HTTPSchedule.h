// Decides which request is sent next: the queues of each host, and the posts that wait for a retry.
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

/// Owns every exchange that is not being transferred. Completes an exchange with an error as soon as it is
/// abandoned. Used only by the client's thread; doesn't read a clock. Abandons an exchange if it runs out of
/// memory for it.
class HTTPSchedule {
 public:
  using Instant = HTTPExchange::Instant;
  using Exchange = HTTPQueue::Exchange;

  explicit HTTPSchedule(const HTTPClient::Options& options);

  /// Queues a new exchange, or abandons it at once if too much is waiting already.
  void add(Exchange exchange) noexcept;

  /// Resumes the posts whose wait is over, abandons queued requests whose time is up, and forgets hosts
  /// without requests.
  void advance(Instant now) noexcept;

  /// The next exchange for which a connection is free, or null. It counts against its host's limit until
  /// `answered` or `failed` is called with it.
  Exchange next(Instant now) noexcept;

  void answered(const HTTPExchange& exchange) noexcept;

  /// The transport failed. Keeps the exchange if `mayRetry` is set and the retry policy allows another
  /// attempt; otherwise abandons it.
  void failed(Exchange exchange, HTTPError error, bool mayRetry, Instant now) noexcept;

  /// Fails all waiting requests except posts with the error `Stopped`.
  void stopAllButPosts() noexcept;
  /// Ends the waits of all posts that wait for a retry.
  void retryNow() noexcept;
  /// Fails everything that waits with `Stopped`.
  void stopAll() noexcept;

  /// The time at which `advance` is due; nullopt if only external events can change anything.
  std::optional<Instant> nextAdvance() const noexcept;

 private:
  /// An owner's posts to a host. Kept as long as the host, so that a post can always return to it.
  struct Lane {
    HTTPQueue posts;
    std::size_t bodies = 0;  ///< bytes of the posts in `posts` and `_retries`
    std::size_t cost = 0;    ///< approximate memory of the same posts
  };
  /// During an outage, the host's posts wait in `_retries`.
  struct Host {
    HTTPQueue requests;
    std::map<std::uint32_t, Lane> lanes;  ///< by owner
    std::uint32_t lastServed = 0;         ///< owner
    std::size_t queuedPosts = 0;
    std::size_t active = 0;
    std::size_t activePosts = 0;
    std::optional<HTTPError> outage;  ///< the last attempt's error, until an answer arrives
  };
  using Hosts = std::map<std::string, Host, std::less<>>;
  using Retries = std::multimap<Instant, Exchange>;
  using Measure = std::size_t (*)(const Host&, const Lane&) noexcept;

  static std::size_t memory(const Host& host, const Lane& lane) noexcept;
  /// Bytes of bodies that wait for the host to come back.
  static std::size_t waitingBodies(const Host& host, const Lane& lane) noexcept;
  static bool isUnused(const Hosts::value_type& entry) noexcept;

  /// Also creates the lane for a post. Returns null if out of memory.
  Host* hostFor(const HTTPExchange& exchange) noexcept;
  /// For an exchange that the schedule has accepted.
  Host& hostOf(const HTTPExchange& exchange) noexcept;
  static Lane& laneOf(Host& host, const HTTPExchange& exchange) noexcept;

  /// The post must already be counted in its lane.
  static void queueFirst(Host& host, Exchange post) noexcept;
  /// Returns null if no post is queued.
  static Exchange takePost(Host& host) noexcept;
  static Exchange takePost(Host& host, Lane& lane) noexcept;
  void bringBack(Host& host) noexcept;

  /// Whether `size` more bytes fit within `bound`, after dropping posts from fuller lanes if necessary.
  bool makeRoom(Measure measure, const Host& host, const Lane& lane, std::size_t size,
                std::size_t bound) noexcept;
  void dropOne(Host& host, Lane& lane) noexcept;

  void release(Host& host, const HTTPExchange& exchange) noexcept;
  void beginOutage(Host& host, const HTTPExchange& exchange, const HTTPError& error, Instant now) noexcept;
  /// Returns true if it took `exchange` for a retry.
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
