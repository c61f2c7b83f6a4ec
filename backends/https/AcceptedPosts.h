// When servers accepted posts, for operators.
#pragma once

#include <chrono>
#include <map>
#include <string>
#include <string_view>

#include "platform/sync/Mutex.h"

namespace vesk {

/// Thread-safe. Knows at most 64 hosts, since storebags name few.
class AcceptedPosts {
 public:
  using Clock = std::chrono::steady_clock;

  /// `host`: scheme, host and port, as in the URL.
  void note(std::string_view host) {
    MutexLock lock(_mutex);
    const auto known = _last.find(host);
    if (known != _last.end()) {
      known->second = Clock::now();
    } else if (_last.size() < kMostHosts) {
      _last.emplace(host, Clock::now());
    }
  }

  std::map<std::string, Clock::time_point, std::less<>> all() const {
    MutexLock lock(_mutex);
    return _last;
  }

 private:
  static constexpr std::size_t kMostHosts = 64;
  mutable Mutex _mutex;
  std::map<std::string, Clock::time_point, std::less<>> _last VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
