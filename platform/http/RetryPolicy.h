// When a post that could not be delivered is tried again.
#pragma once

#include <chrono>
#include <optional>

namespace vesk {

/// A pure function of the time: waits double from one failure to the next and are spread by ±50 %, so that
/// the posts of an outage do not all return at the same moment.
struct RetryPolicy {
  using Instant = std::chrono::steady_clock::time_point;
  using Duration = std::chrono::steady_clock::duration;

  Duration retryFor;     ///< from the first attempt to the last
  Duration firstWait;    ///< after the first failure
  Duration longestWait;  ///< before it is spread

  /// How long to wait before the next attempt; nothing when the post is to be given up.
  /// `failures`: attempts that failed so far, at least one. `random`: in [0, 1).
  std::optional<Duration> waitAfter(unsigned failures, Instant firstAttempt, Instant now,
                                    double random) const;
};

}  // namespace vesk
