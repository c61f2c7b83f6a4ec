// Caches the fetched storebags and decides when to fetch again.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "platform/ipc/WarningBurst.h"
#include "platform/sync/Mutex.h"
#include "platform/time/Clock.h"
#include "storebag/StorebagFetch.h"

namespace vesk {

/// Fetches the section of a client type's storebag that applies to this device. Blocks during the request.
using StorebagFetcher = std::function<std::optional<Dictionary>(
    std::int32_t clientType, std::int32_t& maxAge, std::optional<std::string>& version, bool& notModified,
    std::optional<std::string>& lastModified, FetchFacts& facts)>;

/// Whether the storebag of that name that is in force has expired.
using StorebagExpiry = std::function<bool(std::string_view name)>;

/// Storebags that were kept on disk, and how fetches are spread over time where they serve meanwhile.
struct KeptStorebagSource {
  /// The kept section of a client type, if there is one.
  std::function<std::optional<KeptSection>(std::int32_t clientType)> load;
  /// Uniformly from [0, 1).
  std::function<double()> random;
  /// Since the device's start.
  std::function<std::chrono::seconds()> uptime;

  /// After a start of the device, the first fetch of a kept storebag is made within this time, so that many
  /// devices do not fetch at once after a power cut.
  static constexpr std::chrono::seconds kSpread{15 * 60};
  /// A storebag's age is shortened by up to this share, so that they do not fetch at once each day.
  static constexpr double kShortening = 0.1;
};

/// What the daemon knows of a storebag, for operators.
struct StorebagStatus {
  std::string name;
  std::optional<Dictionary> section;  ///< in force; nullopt if there is none
  std::optional<std::string> version;
  std::optional<WallTime> fetched;  ///< the end of the last attempt
  bool isGood = false;              ///< the last attempt succeeded
  std::int32_t maxAge = 0;          ///< seconds
  std::string origin{};             ///< its URL, "built in" or "kept on disk"
  std::string key{};                ///< that verified it, unless it was kept or is built in
};

/// Keeps one record per storebag name, in memory, for the life of the daemon. Except for `status`, not
/// thread-safe: the agent calls it with its monitor held, also during a fetch, so that two sessions never
/// fetch the same storebag at once.
class StorebagCache {
 public:
  /// The wait after a failed attempt.
  static constexpr std::chrono::seconds kMinimumWaitAfterFailure{900};

  StorebagCache(StorebagFetcher fetch, std::optional<KeptStorebagSource> kept, const WallClock& clock,
                StorebagExpiry hasExpired = {})
      : _fetch(std::move(fetch)), _kept(std::move(kept)), _clock(clock), _hasExpired(std::move(hasExpired)) {}

  /// Returns the cached section if it is fresh or must not be fetched yet; otherwise fetches it, and returns
  /// the last good section if that fails. Returns nullopt for a client type without a storebag, and for a
  /// storebag that has expired.
  std::optional<Dictionary> storebagForClientType(std::int32_t clientType);

  /// The version of the last good section; never fetches.
  std::optional<std::string> versionForClientType(std::int32_t clientType) const;

  /// All records. Thread-safe; doesn't wait for a fetch.
  std::vector<StorebagStatus> status() const;

 private:
  enum class FetchState { Successful, Failure };

  struct Record {
    std::optional<Dictionary> storebagData;
    std::optional<std::string> storebagVersion;
    std::optional<WallTime> storebagFetchTime;  // end of the last attempt
    FetchState storebagFetchState = FetchState::Failure;
    std::int32_t storebagMaxAge = 0;  // seconds, as reported by the last attempt
    std::optional<std::string> storebagLastModified;
    std::string origin;
    std::string key;
  };

  /// Whether the record may be served without a fetch. Logs the reason.
  bool isFresh(const Record& record, std::int32_t clientType) const;
  bool mustReplace(std::string_view name, const Record& record) const;
  void fetchAndCacheStorebag(std::int32_t clientType);
  /// A new record from the kept storebag, fresh until its first fetch is due; nullopt if there is none.
  std::optional<Record> keptRecord(std::int32_t clientType) const;

  void publish(const std::string& name, const Record& record);

  const StorebagFetcher _fetch;
  const std::optional<KeptStorebagSource> _kept;
  const WallClock& _clock;
  const StorebagExpiry _hasExpired;
  WarningBurst _unknownTypes;
  std::map<std::string, Record> _records;

  mutable Mutex _mutex;  // a leaf
  std::map<std::string, StorebagStatus> _published VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
