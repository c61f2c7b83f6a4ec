#include "platform/outbox/HostBackoff.h"

#include <algorithm>

namespace vesk {

void HostBackoff::begin(Instant now, double random) {
  if (_failures == 0) failed(now, random);
}

void HostBackoff::resume(Instant now, double random) {
  _failures = 1;
  _next = now + std::chrono::duration_cast<Duration>(kSpread * random);
}

void HostBackoff::networkChanged(Instant now, double random) {
  if (isUp() || _isHeld) return;
  _next = std::min(_next, now + std::chrono::duration_cast<Duration>(kSpread * random));
}

void HostBackoff::failed(Instant now, double random) {
  _isHeld = false;
  _next = now + wait(random);
}

void HostBackoff::held(Instant now, std::optional<std::chrono::seconds> retryAfter, double random) {
  Duration until = wait(random);
  if (retryAfter) until = std::clamp<Duration>(*retryAfter, Duration::zero(), kLongestRetryAfter);
  _isHeld = true;
  _next = now + until;
}

void HostBackoff::succeeded() {
  _failures = 0;
  _isHeld = false;
  _next = {};
}

void HostBackoff::hostAnswered(Instant now) {
  if (!_isHeld) _next = std::min(_next, now);
}

HostBackoff::Duration HostBackoff::wait(double random) {
  std::chrono::seconds longest = kFirstWait;
  for (unsigned i = 0; i < _failures && longest < kLongestWait; ++i) longest *= kGrowth;
  ++_failures;
  return std::chrono::duration_cast<Duration>(std::min(longest, kLongestWait) * (0.5 + random));
}

}  // namespace vesk
