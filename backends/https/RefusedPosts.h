// Logs the events that servers refuse.
#pragma once

#include <chrono>
#include <cstddef>
#include <map>
#include <string>

#include "platform/ipc/WarningBurst.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// Logs one line per burst and backend name, for all sessions together: a server that moved refuses every
/// post of every session. Thread-safe.
class RefusedPosts {
 public:
  using Instant = std::chrono::steady_clock::time_point;

  /// Notes that a server answered `status` and that `events` events are lost. The line counts them, and those
  /// of the previous burst that came after its line.
  void note(const std::string& backend, long status, std::size_t events,
            Instant now = std::chrono::steady_clock::now());

 private:
  struct OfBackend {
    WarningBurst burst;
    std::size_t untold = 0;
  };

  Mutex _mutex;
  std::map<std::string, OfBackend> _backends VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
