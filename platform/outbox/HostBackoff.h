// Decides when the posts that were put aside for a host are tried again.
#pragma once

#include <chrono>
#include <optional>

namespace vesk {

/// The state of one host's backlog. Waits grow from 30 s to 15 minutes, each drawn uniformly within ±50 %, so
/// that many devices do not return at the same moment. Pure: time and chance are given, `random` from [0, 1).
class HostBackoff {
 public:
  using Instant = std::chrono::steady_clock::time_point;
  using Duration = std::chrono::steady_clock::duration;

  static constexpr std::chrono::seconds kFirstWait{30};
  static constexpr unsigned kGrowth = 3;
  static constexpr std::chrono::seconds kLongestWait{15 * 60};
  /// After a start or a change of network, the first attempt is made within this time.
  static constexpr std::chrono::seconds kSpread{60};
  /// A server can't ask for a longer wait.
  static constexpr std::chrono::seconds kLongestRetryAfter{24 * 60 * 60};

  /// The host's first post was just put aside.
  void begin(Instant now, double random);
  /// Posts wait from before the process's start.
  void resume(Instant now, double random);
  void networkChanged(Instant now, double random);

  /// An attempt of the backlog was not answered.
  void failed(Instant now, double random);
  /// An attempt of the backlog was answered by a server that is busy or broken (429, 5xx). Until the wait is
  /// over, no other answer resumes the backlog.
  void held(Instant now, std::optional<std::chrono::seconds> retryAfter, double random);
  /// An attempt of the backlog was answered otherwise.
  void succeeded();
  /// Anything else was answered by the host.
  void hostAnswered(Instant now);

  /// The time of the next attempt.
  Instant next() const { return _next; }
  /// Whether the last thing known of the host is that it answers.
  bool isUp() const { return _failures == 0; }

 private:
  Duration wait(double random);

  unsigned _failures = 0;
  bool _isHeld = false;
  Instant _next{};
};

}  // namespace vesk
