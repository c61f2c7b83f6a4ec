#include "platform/preferences/PreferencesSuite.h"

#include <pwd.h>
#include <unistd.h>

#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "platform/files/RootPrefix.h"
#include "platform/preferences/TomlFile.h"

namespace vesk {

namespace {

constexpr std::size_t kLongestPasswordEntry = std::size_t{16} << 10;

/// Whether the account has a login shell. Settings are not read from a service account's home: the service
/// can write there, so a compromised daemon could redirect later ones to another server.
bool canLogIn(uid_t user) {
  std::vector<char> room(kLongestPasswordEntry);
  passwd entry{};
  passwd* found = nullptr;
  if (::getpwuid_r(user, &entry, room.data(), room.size(), &found) != 0 || !found) return false;
  const std::string_view shell = found->pw_shell;
  return !shell.ends_with("/nologin") && !shell.ends_with("/false");
}

/// Whether this process's user can log in. Looked up once, because a sandboxed process can't see /etc/passwd
/// after it has been replaced.
bool isLoginUser() {
  constexpr std::uint64_t kKnown = 2;
  static std::atomic<std::uint64_t> last{0};  // user << 2, known, answer
  const std::uint64_t user = ::geteuid();
  std::uint64_t answer = last;
  if (answer >> 2 != user || (answer & kKnown) == 0)
    last = answer = user << 2 | kKnown | (canLogIn(static_cast<uid_t>(user)) ? 1 : 0);
  return (answer & 1) != 0;
}

std::optional<std::string> userConfigurationDirectory() {
  if (!isLoginUser()) return std::nullopt;
  const char* config = std::getenv("XDG_CONFIG_HOME");
  if (config && config[0] == '/') return std::string(config);
  const char* home = std::getenv("HOME");
  if (home && home[0] == '/') return std::string(home) + "/.config";
  return std::nullopt;
}

}  // namespace

PreferencesSuite::PreferencesSuite(std::string_view suite) {
  if (suite.size() > 128 || !isPlainFileName(suite)) return;
  const auto read = [&](const std::string& directory, TrustedOwner owner) {
    std::string path =
        pathUnderRoot(directory + "/veskreporting/preferences/" + std::string(suite) + ".toml");
    Dictionary settings = readTomlFile(path, owner);
    _files.push_back({std::move(path), std::move(settings)});
  };
  read("/etc", TrustedOwner::Root);
  if (auto user = userConfigurationDirectory()) read(*user, TrustedOwner::OwnUser);
}

std::optional<PreferencesSuite::Setting> PreferencesSuite::settingForKey(std::string_view key) const {
  for (auto file = _files.rbegin(); file != _files.rend(); ++file) {
    if (const Value* value = file->settings.find(key)) return Setting{*value, file->path};
  }
  return std::nullopt;
}

std::optional<Value> PreferencesSuite::valueForKey(std::string_view key) const {
  auto setting = settingForKey(key);
  return setting ? std::optional(std::move(setting->value)) : std::nullopt;
}

}  // namespace vesk
