// Decides which request is sent next: the queues of each host, and the posts that wait for a retry.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <optional>
#include <random>
#include <string>
#include <string_view>

#include "platform/http/HTTPExchange.h"
#include "platform/http/RetryPolicy.h"

namespace vesk {

/// Owns every exchange that is not being transferred. Gives an exchange up, to the keeper if it is a post, as
/// soon as it may not wait any longer. Used only by the client's thread; doesn't read a clock.
class HTTPSchedule {
 public:
  using Instant = HTTPExchange::Instant;
  using Exchange = std::unique_ptr<HTTPExchange>;

  /// The outcome of an attempt that was not answered.
  struct Failure {
    HTTPError error;
    bool mayRetry = false;      ///< another attempt may succeed
    bool mayKeep = false;       ///< another attempt may succeed, perhaps much later
    bool wasSentWhole = false;  ///< the server may be processing it
  };

  explicit HTTPSchedule(const HTTPClient::Options& options);

  /// Queues a new exchange, or gives it up at once if too much is waiting already.
  void add(Exchange exchange);

  /// Resumes the posts whose wait is over, gives up queued requests whose time is up, and forgets hosts
  /// without requests that are not in an outage. Few hosts exist, since signed storebags name them.
  void advance(Instant now);

  /// The next exchange for which a connection is free, or null. It counts against its host's limit until
  /// `answered` or `failed` is called with it.
  Exchange next(Instant now);

  void answered(const HTTPExchange& exchange, Instant now);
  /// Keeps the exchange if it may be retried and the retry policy allows another attempt; otherwise gives it
  /// up.
  void failed(Exchange exchange, Failure failure, Instant now);

  /// Fails all waiting requests except posts with the error `Stopped`. Posts that wait for a host to come
  /// back go to the keeper; without one, they are tried immediately. From now on a post is retried only if
  /// there is no keeper.
  void stopAllButPosts();
  /// Gives up everything that waits with `Stopped`.
  void stopAll();

  /// The time at which `advance` is due; nullopt if only external events can change anything.
  std::optional<Instant> nextAdvance() const;

 private:
  using Queue = std::deque<Exchange>;
  /// An owner's posts to a host.
  struct Lane {
    Queue posts;
    std::size_t bodies = 0;  ///< bytes of the posts in `posts` and `_retries`
    std::size_t cost = 0;    ///< approximate memory of the same posts
  };
  /// During an outage, the host's posts wait in `_retries`.
  struct Host {
    Queue requests;
    Queue background;
    std::map<std::uint32_t, Lane> lanes;  ///< by owner
    std::uint32_t lastServed = 0;         ///< owner
    std::size_t queuedPosts = 0;
    std::size_t active = 0;
    std::size_t activePosts = 0;
    std::size_t activeBackground = 0;
    std::optional<HTTPError> outage;  ///< the last attempt's error, until an answer arrives
    Instant lastAnswer;               ///< or when the host got its first request
    bool isSilent = false;            ///< its posts are not charged to their senders
  };
  using Hosts = std::map<std::string, Host, std::less<>>;
  using Retries = std::multimap<Instant, Exchange>;
  using Measure = std::size_t (*)(const Host&, const Lane&);

  static std::size_t memory(const Host& host, const Lane& lane);
  /// Bytes of bodies that wait for the host to come back.
  static std::size_t waitingBodies(const Host& host, const Lane& lane);
  static bool isUnused(const Hosts::value_type& entry);
  static Exchange takeFirst(Queue& queue);

  /// For an exchange that the schedule has accepted.
  Host& hostOf(const HTTPExchange& exchange);
  static Lane& laneOf(Host& host, const HTTPExchange& exchange);

  /// The post must already be counted in its lane.
  static void queueFirst(Host& host, Exchange post);
  /// Returns null if no post is queued.
  static Exchange takePost(Host& host);
  static Exchange takePost(Host& host, Lane& lane);
  void bringBack(Host& host);

  /// Whether `size` more bytes fit within `bound`, after giving up posts from fuller lanes if necessary.
  bool makeRoom(Measure measure, const Host& host, const Lane& lane, std::size_t size, std::size_t bound);
  void giveUpOne(Host& host, Lane& lane);
  void giveUp(Exchange exchange, HTTPError error) { exchange->giveUp(std::move(error), _keeper); }

  /// The time at which a queued post has waited too long for a host that doesn't answer; nullopt if it may
  /// wait.
  std::optional<Instant> endOfWait(const Host& host, const HTTPExchange& post) const;
  /// Takes the host's waiting posts off their senders' accounts if it does not answer.
  static void dischargeIfSilent(Host& host, Instant now);
  /// Whether there is a keeper, and the host has not answered for as long as posts are tried again.
  bool isLongOutage(const Host& host, Instant now) const;
  /// Gives up the queued posts that waited too long for the host.
  void giveUpLate(Host& host, Instant now);

  void release(Host& host, const HTTPExchange& exchange);
  static void noteOutage(Host& host, const HTTPExchange& exchange, const HTTPError& error);
  /// Returns true if it took `exchange` for a retry.
  bool keepForRetry(Host& host, Exchange& exchange, bool wasSentWhole, Instant now);

  const RetryPolicy _policy;
  PostKeeper* const _keeper;
  const std::size_t _maximumWaiting;
  const std::size_t _maximumMemory;
  const std::size_t _maximumActive;
  const std::size_t _maximumActivePosts;
  std::minstd_rand _random;

  bool _ending = false;
  Hosts _hosts;
  Retries _retries;
};

}  // namespace vesk
