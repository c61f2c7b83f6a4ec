// Serves a folder of storebags, signed on the fly.
#pragma once

#include <chrono>
#include <optional>

#include "tools/collector/FaultyEndpoint.h"
#include "tools/collector/StorebagFolder.h"
#include "tools/storebag/SigningKey.h"

namespace vesk {

/// Answers GET with the storebag that the last part of the path names, or with 304 and no body when
/// If-Modified-Since names its date or a later one. A source with mistakes is answered with 500 and told on
/// the console.
class StorebagEndpoint : public FaultyEndpoint {
 public:
  /// `maximumAge`: sent as "Cache-Control: max-age=…" when set.
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
