#include "daemon/StorebagCache.h"

#include "platform/log/SystemLog.h"
#include "storebag/StorebagNaming.h"

namespace vesk {

std::optional<Dictionary> StorebagCache::storebagForClientType(std::int32_t clientType) {
  auto name = storebagNameForClientType(clientType);
  if (!name) {
    if (_unknownTypes.begins())
      VESK_LOG_WARNING("storebagForSession: no storebag is for client type %d", clientType);
    return std::nullopt;
  }
  auto record = _records.find(std::string(*name));
  if (record == _records.end()) {
    if (auto kept = keptRecord(clientType)) {
      record = _records.emplace(*name, *std::move(kept)).first;
      publish(record->first, record->second);
    }
  }
  if (record == _records.end() || mustReplace(*name, record->second) ||
      !isFresh(record->second, clientType)) {
    fetchAndCacheStorebag(clientType);
    record = _records.find(std::string(*name));
  }
  if (_hasExpired && _hasExpired(*name)) return std::nullopt;
  return record->second.storebagData;
}

// However fresh it is, an expired storebag is fetched again, as often as after a failure.
bool StorebagCache::mustReplace(std::string_view name, const Record& record) const {
  if (!_hasExpired || !record.storebagFetchTime || !_hasExpired(name)) return false;
  return std::chrono::abs(_clock.now() - *record.storebagFetchTime) >= kMinimumWaitAfterFailure;
}

// Uses the absolute age: if the clock was set back, the wait gets longer or shorter, but fetching is never
// blocked for ever.
bool StorebagCache::isFresh(const Record& record, std::int32_t clientType) const {
  if (!record.storebagFetchTime) return false;
  auto age = std::chrono::abs(_clock.now() - *record.storebagFetchTime);
  bool successful = record.storebagFetchState == FetchState::Successful;
  if (successful && age < std::chrono::seconds(record.storebagMaxAge)) {
    VESK_LOG_DEBUG("storebagForSession: Cached storebag found for client type %d", clientType);
    return true;
  }
  if (!successful && age < kMinimumWaitAfterFailure) {
    VESK_LOG_INFO(
        "storebagForSession: Not fetching storebag for client type %d - must wait %d seconds between "
        "attempts",
        clientType, static_cast<int>(kMinimumWaitAfterFailure.count()));
    return true;
  }
  return false;
}

void StorebagCache::fetchAndCacheStorebag(std::int32_t clientType) {
  VESK_LOG_DEBUG("fetchAndCacheStorebag: Fetching storebag for client type %d", clientType);
  Record& record = _records[std::string(*storebagNameForClientType(clientType))];
  std::int32_t maxAge = 0;  // the value if a fetch gets no answer
  std::optional<std::string> version;
  bool notModified = false;
  std::optional<std::string> lastModified = record.storebagLastModified;
  FetchFacts facts;
  auto section = _fetch(clientType, maxAge, version, notModified, lastModified, facts);
  VESK_LOG_DEBUG("fetchAndCacheStorebag: Storebag max age: %d seconds", maxAge);
  bool successful = section || notModified;
  if (section) {
    record.storebagData = std::move(section);
    record.storebagVersion = std::move(version);
    record.origin = std::move(facts.origin);
    record.key = std::move(facts.key);
  } else if (!notModified) {
    VESK_LOG_ERROR("fetchAndCacheStorebag: Unable to fetch storebag for client type %d", clientType);
  }
  record.storebagFetchTime = _clock.now();
  record.storebagFetchState = successful ? FetchState::Successful : FetchState::Failure;
  record.storebagMaxAge = maxAge;
  if (_kept && maxAge > 0) {
    record.storebagMaxAge -=
        static_cast<std::int32_t>(maxAge * KeptStorebagSource::kShortening * _kept->random());
  }
  if (lastModified) record.storebagLastModified = std::move(lastModified);
  publish(std::string(*storebagNameForClientType(clientType)), record);
}

void StorebagCache::publish(const std::string& name, const Record& record) {
  MutexLock lock(_mutex);
  _published[name] = {.name = name,
                      .section = record.storebagData,
                      .version = record.storebagVersion,
                      .fetched = record.storebagFetchTime,
                      .isGood = record.storebagFetchState == FetchState::Successful,
                      .maxAge = record.storebagMaxAge,
                      .origin = record.origin,
                      .key = record.key};
}

std::vector<StorebagStatus> StorebagCache::status() const {
  MutexLock lock(_mutex);
  std::vector<StorebagStatus> all;
  for (const auto& [name, status] : _published) all.push_back(status);
  return all;
}

std::optional<StorebagCache::Record> StorebagCache::keptRecord(std::int32_t clientType) const {
  auto kept = _kept ? _kept->load(clientType) : std::nullopt;
  if (!kept) return std::nullopt;
  Record record;
  record.storebagData = std::move(kept->section);
  record.storebagVersion = std::move(kept->version);
  record.storebagLastModified = std::move(kept->lastModified);
  record.origin = "kept on disk";
  const auto due =
      std::chrono::duration_cast<std::chrono::seconds>(KeptStorebagSource::kSpread * _kept->random());
  const auto wait = due - _kept->uptime();
  if (wait > wait.zero()) {
    record.storebagFetchTime = _clock.now();
    record.storebagFetchState = FetchState::Successful;
    record.storebagMaxAge = static_cast<std::int32_t>(wait.count());
  }
  return record;
}

std::optional<std::string> StorebagCache::versionForClientType(std::int32_t clientType) const {
  auto name = storebagNameForClientType(clientType);
  if (!name) return std::nullopt;
  auto record = _records.find(std::string(*name));
  return record == _records.end() ? std::nullopt : record->second.storebagVersion;
}

}  // namespace vesk
