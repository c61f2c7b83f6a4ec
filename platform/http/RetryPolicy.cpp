#include "platform/http/RetryPolicy.h"

#include <algorithm>

namespace vesk {

std::optional<RetryPolicy::Duration> RetryPolicy::waitAfter(unsigned failures, Instant firstAttempt,
                                                            Instant now, double random) const {
  Duration left = firstAttempt + retryFor - now;
  if (left <= Duration::zero()) return std::nullopt;

  Duration wait = std::min(firstWait, longestWait);
  for (unsigned i = 1; i < failures && wait < longestWait; ++i) wait = std::min(wait * 2, longestWait);
  auto spread = std::chrono::duration_cast<Duration>(wait * (0.5 + random));
  // The last attempt is made at the time limit, even if a full wait no longer fits.
  return std::min(spread, left);
}

}  // namespace vesk
