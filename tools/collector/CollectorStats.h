// What the collector has counted since it started.
#pragma once

#include <atomic>
#include <cstdint>
#include <vector>

namespace vesk {

/// Each counter is atomic.
struct CollectorStats {
  struct Counter : std::atomic<std::uint64_t> {
    Counter(CollectorStats& stats, const char* counterName) : name(counterName) { stats.all.push_back(this); }
    const char* const name;
  };

  std::vector<const Counter*> all;  ///< in order of declaration; constant after construction

  Counter posts{*this, "posts"};                            ///< accepted
  Counter events{*this, "events"};                          ///< in accepted posts
  Counter eventsNotSaved{*this, "eventsNotSaved"};          ///< in posts left unanswered; the file failed
  Counter storebagsSent{*this, "storebagsSent"};            ///< complete, even with a requested bad signature
  Counter storebagsUnchanged{*this, "storebagsUnchanged"};  ///< answered with 304
  Counter datagrams{*this, "datagrams"};                    ///< accepted from dashboards
  Counter datagramsAgain{*this, "datagramsAgain"};          ///< of these, repeated ones
  Counter datagramsMalformed{*this, "datagramsMalformed"};  ///< rejected as malformed
  Counter datagramsLost{*this, "datagramsLost"};            ///< dropped on request
  Counter acknowledgements{*this, "acknowledgements"};      ///< sent
  Counter acknowledgementsLost{*this, "acknowledgementsLost"};  ///< dropped on request
  Counter logData{*this, "logData"};                            ///< uploads of log data
  Counter uploads{*this, "uploads"};                            ///< accepted files
  Counter refused{*this, "refused"};                            ///< requests that violate the protocol
  Counter notHTTP{*this, "notHTTP"};  ///< connections that ended before a complete request
  Counter faults{*this, "faults"};    ///< injected faults
};

}  // namespace vesk
