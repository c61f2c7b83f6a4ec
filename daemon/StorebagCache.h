// Caches the fetched storebags and decides when to fetch again.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>

#include <VeskReporting/values/Value.h>
#include "platform/time/Clock.h"
#include "storebag/StorebagFetch.h"

namespace vesk {

/// Fetches the section of a client type's storebag that applies to this device. Blocks during the request.
using StorebagFetcher = std::function<std::optional<Dictionary>(
    std::int32_t clientType, std::int32_t& maxAge, std::optional<std::string>& version, bool& notModified,
    std::optional<std::string>& lastModified)>;

/// Keeps one record per storebag name, in memory, for the life of the daemon. Not thread-safe: the agent
/// calls it with its monitor held, also during a fetch, so that two sessions never fetch the same storebag at
/// once.
class StorebagCache {
 public:
  /// The wait after a failed attempt.
  static constexpr std::chrono::seconds kMinimumWaitAfterFailure{900};

  StorebagCache(StorebagFetcher fetch, const WallClock& clock) : _fetch(std::move(fetch)), _clock(clock) {}

  /// Returns the cached section if it is fresh or must not be fetched yet; otherwise fetches it, and returns
  /// the last good section if that fails. Returns nullopt for a client type without a storebag.
  std::optional<Dictionary> storebagForClientType(std::int32_t clientType);

  /// The version of the last good section; never fetches.
  std::optional<std::string> versionForClientType(std::int32_t clientType) const;

 private:
  enum class FetchState { Successful, Failure };

  struct Record {
    std::optional<Dictionary> storebagData;
    std::optional<std::string> storebagVersion;
    std::optional<WallTime> storebagFetchTime;  // end of the last attempt
    FetchState storebagFetchState = FetchState::Failure;
    std::int32_t storebagMaxAge = 0;  // seconds, as reported by the last attempt
    std::optional<std::string> storebagLastModified;
  };

  /// Whether the record may be served without a fetch. Logs the reason.
  bool isFresh(const Record& record, std::int32_t clientType) const;
  void fetchAndCacheStorebag(std::int32_t clientType);

  const StorebagFetcher _fetch;
  const WallClock& _clock;
  std::map<std::string, Record> _records;
};

}  // namespace vesk
