// What the collector has counted since it started.
#pragma once

#include <atomic>
#include <cstdint>
#include <vector>

namespace vesk {

/// Each counter is synchronised by itself.
struct CollectorStats {
  struct Counter : std::atomic<std::uint64_t> {
    Counter(CollectorStats& stats, const char* counterName) : name(counterName) { stats.all.push_back(this); }
    const char* const name;
  };

  std::vector<const Counter*> all;  ///< in the order of their declaration; constant after construction

  Counter posts{*this, "posts"};                    ///< taken
  Counter events{*this, "events"};                  ///< in the posts taken
  Counter eventsNotSaved{*this, "eventsNotSaved"};  ///< in posts left unanswered since the file failed
  Counter storebagsSent{*this, "storebagsSent"};    ///< whole, also those with a bad signature on demand
  Counter storebagsUnchanged{*this, "storebagsUnchanged"};      ///< answered with 304
  Counter datagrams{*this, "datagrams"};                        ///< of dashboards, taken
  Counter datagramsAgain{*this, "datagramsAgain"};              ///< of these, that had been there before
  Counter datagramsMalformed{*this, "datagramsMalformed"};      ///< that were none
  Counter datagramsLost{*this, "datagramsLost"};                ///< on demand
  Counter acknowledgements{*this, "acknowledgements"};          ///< sent
  Counter acknowledgementsLost{*this, "acknowledgementsLost"};  ///< on demand
  Counter logData{*this, "logData"};                            ///< uploads of log data
  Counter uploads{*this, "uploads"};                            ///< files taken
  Counter refused{*this, "refused"};                            ///< requests that were not the protocol
  Counter notHTTP{*this, "notHTTP"};  ///< connections that did not get as far as a request
  Counter faults{*this, "faults"};    ///< faults on demand
};

}  // namespace vesk
