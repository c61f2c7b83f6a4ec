// The device's persistent identifiers, one for each consent mode.
#pragma once

#include <optional>
#include <string>

#include "platform/result/Result.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// The identifiers stored in one file. Thread-safe.
///
/// The file is created on first use, atomically by rename, with mode 0600. A lock file beside it, awaited for
/// at most half a second, ensures that only one of several processes creates it. If root creates the file,
/// the directory's owner (the daemon's user) gets it. An unreadable or malformed file is renamed to
/// "<path>.bad" and replaced by new identifiers, with a line of level 4. Identifiers that can't be stored
/// live as long as this object.
class PersistentIdentifiers {
 public:
  explicit PersistentIdentifiers(std::string path) : _path(std::move(path)) {}

  /// Returns a UUID as text.
  std::string identifier(bool respectsConsent);

  /// Makes new identifiers, in the file too.
  void renew();

 private:
  struct Pair {
    std::string respecting;
    std::string overriding;
  };

  Pair load() const;
  std::optional<Pair> readFile() const;
  Result<void> store(const Pair& pair) const;
  static std::optional<Pair> parse(const std::string& text);

  const std::string _path;
  Mutex _mutex;
  std::optional<Pair> _pair VESK_GUARDED_BY(_mutex);
};

/// Uses the process's one instance, for /var/lib/veskreportingd/identifiers.toml. Returns an empty string if
/// out of memory.
std::string persistentIdentifierForDNU(bool respectsConsent) noexcept;

/// Makes new ones.
void renewPersistentIdentifiers();

}  // namespace vesk
