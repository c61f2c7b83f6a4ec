// When a post that could not be delivered is tried again.
#pragma once

#include <chrono>
#include <cstddef>
#include <optional>

namespace vesk {

/// A pure function of the time: waits double from one failure to the next and are spread by ±50 %, so that
/// the posts of an outage do not all return at the same moment.
struct RetryPolicy {
  using Instant = std::chrono::steady_clock::time_point;
  using Duration = std::chrono::steady_clock::duration;

  Duration retryFor;           ///< from the first attempt to the last
  Duration firstWait;          ///< after the first failure
  Duration longestWait;        ///< before it is spread
  std::size_t maximumWaiting;  ///< bytes of bodies that may wait, the failed one included

  /// How long to wait before the next attempt; nothing when the post is to be given up.
  /// `failures`: attempts that failed so far, at least one. `waiting`: bytes of the bodies that would wait,
  /// this one included. `random`: in [0, 1).
  std::optional<Duration> waitAfter(unsigned failures, Instant firstAttempt, Instant now, std::size_t waiting,
                                    double random) const;
};

}  // namespace vesk
