// Read-only settings of one domain.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// The preferences suite of one domain: /etc/veskreporting/preferences/<suite>.toml, overridden key by key by
/// $XDG_CONFIG_HOME/veskreporting/preferences/<suite>.toml ($HOME/.config if that variable is unset or not
/// absolute). Both paths are below the root prefix. An account without a login shell, such as a service's,
/// uses only the first file.
///
/// The files are read when the suite is constructed; later changes need a new suite. A missing file counts as
/// empty. A malformed or untrusted file (TrustedFile.h) counts as empty and causes one level-4 line. Reading
/// a suite is thread-safe.
class PreferencesSuite {
 public:
  /// The suite is empty if `suite` is not a plain file name (empty, more than 128 bytes, with a "/" or a
  /// leading ".").
  explicit PreferencesSuite(std::string_view suite);

  /// The value under `key`, a top-level key of the files.
  std::optional<Value> valueForKey(std::string_view key) const;

  /// The same, with the path of the file.
  struct Setting {
    Value value;
    std::string file;
  };
  std::optional<Setting> settingForKey(std::string_view key) const;

 private:
  struct File {
    std::string path;
    Dictionary settings;
  };
  std::vector<File> _files;  ///< the last that has a key decides
};

}  // namespace vesk
