// Serves a folder of storebags, signing each one when it is requested.
#pragma once

#include <chrono>
#include <optional>

#include "tools/collector/FaultyEndpoint.h"
#include "tools/collector/StorebagFolder.h"
#include "tools/storebag/SigningKey.h"

namespace vesk {

/// Answers GET with the storebag named by the last component of the path, or with 304 and no body if
/// If-Modified-Since is the storebag's date or later. A source with mistakes gives a 500 and a line on the
/// console.
class StorebagEndpoint : public FaultyEndpoint {
 public:
  /// `maximumAge`: sent as "Cache-Control: max-age=…" if set.
  StorebagEndpoint(const CollectorServices& services, StorebagFolder& folder, const SigningKey& key,
                   std::optional<std::chrono::seconds> maximumAge);

 private:
  HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) override;
  HTTPAnswer send(const HTTPReceived& received, const StorebagFolder::Found& found, bool signWell);
  HTTPHeaderList headersFor(std::time_t lastModified) const;

  StorebagFolder& _folder;
  const SigningKey& _key;
  const std::optional<std::chrono::seconds> _maximumAge;
};

}  // namespace vesk
