// A folder of storebag sources, with a Last-Modified date for each.
#pragma once

#include <sys/stat.h>

#include <ctime>
#include <filesystem>
#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "platform/sync/Mutex.h"
#include "tools/storebag/StorebagSource.h"

namespace vesk {

/// Reads `<name>.toml`, or `<name>.json` if that doesn't exist, for each request. Thread-safe.
class StorebagFolder {
 public:
  StorebagFolder(std::filesystem::path directory, StorebagChecks checks)
      : _directory(std::move(directory)), _checks(checks) {}

  struct Found {
    std::filesystem::path file;
    /// The file's date, advanced by a second if the file changed twice within one, so that two versions never
    /// share a date.
    std::time_t lastModified = 0;
    bool isNew = false;  ///< this version of the file has not been seen before
  };
  /// Returns nullopt if there is no such storebag or the name would lead out of the folder.
  std::optional<Found> find(std::string_view name);

  /// Throws std::runtime_error with a message that names the file and the key.
  StorebagSource read(const Found& found) const { return readStorebagSource(found.file, _checks); }

  const std::filesystem::path& directory() const { return _directory; }

 private:
  struct Version {
    timespec modified{};
    off_t size = 0;
    ino_t inode = 0;
    std::time_t lastModified = 0;
  };

  const std::filesystem::path _directory;
  const StorebagChecks _checks;
  Mutex _mutex;
  std::map<std::filesystem::path, Version> _versions VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
