// Read-only settings of one domain.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// The preferences suite of one domain: /etc/veskreporting/preferences/<suite>.toml, and over it, key by key,
/// $XDG_CONFIG_HOME/veskreporting/preferences/<suite>.toml ($HOME/.config when that variable is unset or not
/// absolute). Both stand under the root prefix. A service's account, which has no login shell, reads
/// only the first.
///
/// The files are read when a suite is constructed and never again; whoever wants what they say now opens a
/// suite now. A file that is missing is empty; one that is unusable, or not trusted (TrustedFile.h), is empty
/// and costs one level-4 line. Safe to read from any thread.
class PreferencesSuite {
 public:
  /// A `suite` that is no plain file name (empty, more than 128 bytes, with a "/" or a leading ".") is empty.
  explicit PreferencesSuite(std::string_view suite);

  /// What the suite holds under `key`, a top-level key of the files.
  std::optional<Value> valueForKey(std::string_view key) const;

 private:
  Dictionary _user;
  Dictionary _system;
};

}  // namespace vesk
