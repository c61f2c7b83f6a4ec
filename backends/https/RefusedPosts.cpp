#include "backends/https/RefusedPosts.h"

#include <utility>

#include "platform/log/SystemLog.h"

namespace vesk {

void RefusedPosts::note(const std::string& backend, long status, std::size_t events, Instant now) {
  std::size_t count = 0;
  {
    MutexLock lock(_mutex);
    OfBackend& its = _backends[backend];
    its.untold += events;
    if (!its.burst.begins(now)) return;
    count = std::exchange(its.untold, 0);
  }
  VESK_LOG_WARNING("HTTPSPostBackend(postJsonMessage): backend %s: server answered %ld, events lost: %zu",
                   backend.c_str(), status, count);
}

}  // namespace vesk
