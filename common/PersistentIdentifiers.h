// The device's stable identifiers, one per consent mode.
#pragma once

#include <optional>
#include <string>

#include "platform/sync/Mutex.h"

namespace vesk {

/// The identifiers kept in one file.
///
/// The file is made on first use: complete or not at all (rename), mode 0600, and by one process when several
/// race (lock file beside it, which is waited for half a second at most). What root makes belongs to the
/// directory's owner, the daemon's user. One that can't be read or understood is kept aside as "<path>.bad"
/// and new identifiers are made, with a level-4 line. Identifiers that can't be stored live as long as this
/// object. Thread-safe.
class PersistentIdentifiers {
 public:
  explicit PersistentIdentifiers(std::string path) : _path(std::move(path)) {}

  /// UUID text.
  std::string identifier(bool respectsConsent);

 private:
  struct Pair {
    std::string respecting;
    std::string overriding;
  };

  Pair load() const;
  std::optional<Pair> readFile() const;
  /// 0, or the errno of what failed.
  int store(const Pair& pair) const;
  static std::optional<Pair> parse(const std::string& text);

  const std::string _path;
  Mutex _mutex;
  std::optional<Pair> _pair VESK_GUARDED_BY(_mutex);
};

/// From the process's one instance for /var/lib/veskreportingd/identifiers.toml; empty when memory runs out.
std::string persistentIdentifierForDNU(bool respectsConsent) noexcept;

}  // namespace vesk
