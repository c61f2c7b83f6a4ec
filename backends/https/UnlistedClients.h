// Tells operators of clients that no entry of a storebag is for.
#pragma once

#include <string>

#include "platform/ipc/WarningBurst.h"
#include "platform/log/SystemLog.h"
#include "platform/sync/Mutex.h"
#include "platform/unicode/UTF8.h"

namespace vesk {

/// Logs one line for a burst of them. Thread-safe.
class UnlistedClients {
 public:
  /// `reason`: a clause that names the client.
  void note(const std::string& backend, const std::string& reason) {
    MutexLock lock(_mutex);
    if (!_burst.begins()) return;
    VESK_LOG_WARNING("HTTPSPostBackend(updateBackendState): %s reports nothing: %s", backend.c_str(),
                     cutToWholeCharacters(reason, kShown).c_str());
  }

 private:
  static constexpr std::size_t kShown = 128;
  Mutex _mutex;
  WarningBurst _burst VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
