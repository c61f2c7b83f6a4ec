// What the collector has counted since it started.
#pragma once

#include <atomic>
#include <cstdint>

namespace vesk {

/// Each counter is synchronised by itself.
struct CollectorStats {
  using Counter = std::atomic<std::uint64_t>;

  Counter posts = 0;                 ///< taken
  Counter events = 0;                ///< in the posts taken
  Counter eventsNotSaved = 0;        ///< taken, but the file could not be written
  Counter storebagsSent = 0;         ///< whole, also those with a bad signature on demand
  Counter storebagsUnchanged = 0;    ///< answered with 304
  Counter datagrams = 0;             ///< of dashboards, taken
  Counter datagramsAgain = 0;        ///< of these, that had been there before
  Counter datagramsMalformed = 0;    ///< that were none
  Counter datagramsLost = 0;         ///< on demand
  Counter acknowledgements = 0;      ///< sent
  Counter acknowledgementsLost = 0;  ///< on demand
  Counter logData = 0;               ///< uploads of log data
  Counter uploads = 0;               ///< files taken
  Counter refused = 0;               ///< requests that were not the protocol
  Counter notHTTP = 0;               ///< connections that did not get as far as a request
  Counter faults = 0;                ///< faults on demand
};

}  // namespace vesk
