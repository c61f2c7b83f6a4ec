// Decides when to retry a post that could not be delivered.
#pragma once

#include <chrono>
#include <optional>

namespace vesk {

/// A pure function of its inputs. Waits double after each failure and vary by ±50 %, so that the posts of an
/// outage do not all return at the same moment.
struct RetryPolicy {
  using Instant = std::chrono::steady_clock::time_point;
  using Duration = std::chrono::steady_clock::duration;

  Duration retryFor;     ///< from the first attempt to the last
  Duration firstWait;    ///< after the first failure
  Duration longestWait;  ///< before jitter

  /// The wait before the next attempt; nullopt if the post should be abandoned. `failures`: the number of
  /// failed attempts, at least 1. `random`: in [0, 1).
  std::optional<Duration> waitAfter(unsigned failures, Instant firstAttempt, Instant now,
                                    double random) const;
};

}  // namespace vesk
