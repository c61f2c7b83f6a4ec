// Serves a folder of storebags, signed on the fly.
#pragma once

#include <chrono>
#include <optional>

#include "tools/collector/Endpoint.h"
#include "tools/collector/StorebagFolder.h"
#include "tools/storebag/SigningKey.h"

namespace vesk {

/// Answers GET with the storebag that the last part of the path names, or with 304 and no body when
/// If-Modified-Since names its date or a later one. A source with mistakes is answered with 500 and told on
/// the console.
class StorebagEndpoint : public Endpoint {
 public:
  struct Parts {
    Console& console;
    CollectorStats& stats;
    FaultPlan& faults;
    StorebagFolder& folder;
    const SigningKey& key;
  };
  /// `maximumAge`: sent as "Cache-Control: max-age=…" when set.
  StorebagEndpoint(Parts parts, std::optional<std::chrono::seconds> maximumAge);

  HTTPAnswer answer(const HTTPReceived& received) override;

 private:
  HTTPAnswer serve(const HTTPReceived& received, bool signWell);
  HTTPAnswer send(const HTTPReceived& received, const StorebagFolder::Found& found, bool signWell);
  HTTPHeaderList headersFor(std::time_t lastModified) const;

  const Parts _parts;
  const Refusals _refuse;
  const FaultyAnswers _faulty;
  const std::optional<std::chrono::seconds> _maximumAge;
};

}  // namespace vesk
