// Serves a folder of storebags, signing each one when it is requested.
#pragma once

#include <sys/stat.h>

#include <chrono>
#include <ctime>
#include <filesystem>
#include <map>
#include <optional>
#include <string_view>

#include "platform/sync/Mutex.h"
#include "tools/collector/Endpoint.h"
#include "tools/storebag/StorebagSigning.h"
#include "tools/storebag/StorebagSource.h"

namespace vesk {

/// Answers GET with the storebag named by the last component of the path, or with 304 and no body if
/// If-Modified-Since is the storebag's date or later. Reads `<name>.toml`, or `<name>.json` if that doesn't
/// exist, for each request. A source with mistakes gives a 500 and a line on the console.
class StorebagEndpoint : public Endpoint {
 public:
  /// `maximumAge`: sent as "Cache-Control: max-age=…" if set.
  StorebagEndpoint(const CollectorServices& services, std::filesystem::path directory, StorebagChecks checks,
                   const SigningKey& key, std::optional<std::chrono::seconds> maximumAge)
      : Endpoint(services, "storebag"),
        _directory(std::move(directory)),
        _checks(checks),
        _key(key),
        _maximumAge(maximumAge) {}

 private:
  struct Found {
    std::filesystem::path file;
    /// The file's date, advanced by a second if the file changed twice within one, so that two versions never
    /// share a date.
    std::time_t lastModified = 0;
    bool isNew = false;  ///< this version of the file has not been seen before
  };
  struct Version {
    struct stat status {};
    std::time_t lastModified = 0;
  };

  HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) override;
  /// Returns nullopt if there is no such storebag or the name would lead out of the folder.
  std::optional<Found> find(std::string_view name);

  const std::filesystem::path _directory;
  const StorebagChecks _checks;
  const SigningKey& _key;
  const std::optional<std::chrono::seconds> _maximumAge;
  Mutex _mutex;
  std::map<std::filesystem::path, Version> _versions VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
