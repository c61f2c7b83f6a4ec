#include "platform/preferences/PreferencesSuite.h"

#include <cstdlib>

#include "platform/files/RootPrefix.h"
#include "platform/preferences/TomlFile.h"

namespace vesk {

namespace {

std::optional<std::string> userConfigurationDirectory() {
  const char* config = std::getenv("XDG_CONFIG_HOME");
  if (config && config[0] == '/') return std::string(config);
  const char* home = std::getenv("HOME");
  if (home && home[0] == '/') return std::string(home) + "/.config";
  return std::nullopt;
}

Dictionary readSuite(const std::string& directory, std::string_view suite) {
  return readTomlFile(
      pathUnderRoot(directory + "/veskreporting/preferences/" + std::string(suite) + ".toml"));
}

}  // namespace

PreferencesSuite::PreferencesSuite(std::string_view suite) {
  if (suite.size() > 128 || !isPlainFileName(suite)) return;
  _system = readSuite("/etc", suite);
  if (auto user = userConfigurationDirectory()) _user = readSuite(*user, suite);
}

std::optional<Value> PreferencesSuite::valueForKey(std::string_view key) const {
  if (const Value* value = _user.find(key)) return *value;
  if (const Value* value = _system.find(key)) return *value;
  return std::nullopt;
}

}  // namespace vesk
