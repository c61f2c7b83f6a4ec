// Says in the log what an operator has to mend.
#pragma once

#include <cstdint>
#include <map>
#include <string>

#include <VeskReporting/values/Value.h>

#include "platform/ipc/WarningBurst.h"

namespace vesk {

/// Keys of the daemon's preferences and of the device's facts that nothing reads, with the nearest known
/// ones.
void warnOfUnknownSettings();

/// The preferences that are set, by key: `value` and `file`, the file that it comes from.
Dictionary settingsInForce();

/// Why storebags can't be fetched, beyond what the fetch itself says. For use by one thread at a time.
class FetchProblems {
 public:
  /// What is known of a fetch that failed.
  struct Fetch {
    std::int32_t clientType = 0;
    long httpStatus = 0;  ///< of the server's answer; 0: there was none
    bool hasPublicKey = true;
  };
  /// One line for each kind of problem, once a burst.
  void note(const Fetch& fetch);

 private:
  void warn(const std::string& line);

  std::map<std::string, WarningBurst> _bursts;  // by line; few, since client types and statuses are few
};

}  // namespace vesk
