#include "platform/sandbox/SandboxProfile.h"

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <iterator>
#include <system_error>

#include "platform/files/RootPrefix.h"
#include "platform/preferences/TomlFile.h"
#include "platform/sandbox/Seccomp.h"

namespace vesk {

namespace {

namespace fs = std::filesystem;

struct PathKey {
  const char* name;
  SandboxPath::Access access;
  bool optional;
};
constexpr PathKey kPathKeys[] = {
    {"read", SandboxPath::Access::Read, false},
    {"read-if-present", SandboxPath::Access::Read, true},
    {"write", SandboxPath::Access::Write, false},
    {"sockets", SandboxPath::Access::Sockets, false},
    {"remove-if-present", SandboxPath::Access::Remove, true},
};

/// What it throws is caught in this file.
[[noreturn]] void fail(const std::string& where, const std::string& what) {
  throw malformed(where + ": " + what);
}

std::string inQuotes(std::string_view text) { return "\"" + std::string(text) + "\""; }

/// Returns the path with its variable expanded and its dots resolved. Returns an empty string if the variable
/// is unset or not an absolute path.
std::string expanded(std::string_view written) {
  std::string path(written);
  if (path.starts_with('$')) {
    auto end = std::min(path.find('/'), path.size());
    const char* value = std::getenv(path.substr(1, end - 1).c_str());
    if (!value || *value != '/') return {};
    path.replace(0, end, value);
  }
  std::string normal = fs::path(path).lexically_normal().string();
  if (normal.size() > 1 && normal.ends_with('/')) normal.pop_back();
  return normal;
}

std::vector<std::string> texts(const std::string& where, const Value& value) {
  const List* list = value.list();
  if (!list) fail(where, "must be a list of strings");
  std::vector<std::string> result;
  for (const Value& item : *list) {
    if (!item.text()) fail(where, "must be a list of strings");
    result.push_back(item.text()->string());
  }
  return result;
}

void addPaths(std::vector<SandboxPath>& paths, const std::string& where, const DictionaryEntry& entry,
              bool underRoot) {
  const auto* key =
      std::ranges::find_if(kPathKeys, [&](const auto& known) { return entry.key == known.name; });
  if (key == std::end(kPathKeys)) fail(where, "unknown key");
  for (const std::string& written : texts(where, entry.value)) {
    if (!written.starts_with('/') && !written.starts_with('$')) {
      fail(where, inQuotes(written) + " is no absolute path");
    }
    std::string path = expanded(written);
    if (path.empty()) continue;
    paths.push_back({underRoot ? pathUnderRoot(path) : path, key->access, key->optional});
  }
}

std::vector<std::uint16_t> ports(const std::string& where, const Value& value) {
  std::vector<std::uint16_t> ports;
  const List* list = value.list();
  if (!list) fail(where, "must be a list of ports");
  for (const Value& port : *list) {
    const std::int64_t number = port.asInteger().value_or(0);
    if (number < 1 || number > 65535) fail(where, "must be a list of ports");
    ports.push_back(static_cast<std::uint16_t>(number));
  }
  return ports;
}

void readEntry(SandboxProfile& profile, const Text& table, const DictionaryEntry& entry) {
  const std::string where = table.string() + "." + entry.key.string();
  if (table == "machine" || table == "root") {
    addPaths(profile.paths, where, entry, table == "root");
  } else if (where == "network.connect") {
    profile.connectPorts = ports(where, entry.value);
  } else if (where == "calls.deny") {
    profile.deniedCalls = texts(where, entry.value);
    for (const std::string& group : profile.deniedCalls) {
      if (!isCallGroup(group)) fail(where, "unknown group " + inQuotes(group));
    }
  } else {
    fail(where, "unknown key");
  }
}

SandboxProfile profileFrom(const Dictionary& document) {
  constexpr std::string_view kTables[] = {"machine", "root", "network", "calls"};
  SandboxProfile profile;
  for (const DictionaryEntry& entry : document) {
    const std::string where = entry.key.string();
    if (entry.key == "landlock") {
      profile.landlockRequired = entry.value == Value("required");
      if (profile.landlockRequired || entry.value == Value("if-available")) continue;
      fail(where, "must be \"required\" or \"if-available\"");
    }
    if (std::ranges::find(kTables, where) == std::end(kTables)) fail(where, "unknown key");
    const Dictionary* table = entry.value.dictionary();
    if (!table) fail(where, "must be a table");
    for (const DictionaryEntry& each : *table) readEntry(profile, entry.key, each);
  }
  return profile;
}

}  // namespace

Result<SandboxProfile> parseSandboxProfile(std::string_view toml) {
  const auto document = parseToml(toml);
  if (!document) return document.error();
  try {
    return profileFrom(*document);
  } catch (const Error& error) {
    return error;
  }
}

Result<void> makeDirectories(const std::vector<SandboxPath>& paths) {
  for (const SandboxPath& path : paths) {
    if (path.access == SandboxPath::Access::Read || path.optional) continue;
    std::error_code error;
    if (fs::exists(path.path, error)) continue;
    fs::create_directories(path.path, error);
    auto mode = path.access == SandboxPath::Access::Sockets ? fs::perms{0755} : fs::perms{0750};
    if (!error) fs::permissions(path.path, mode, error);
    if (error) return systemError(error.value(), path.path);
  }
  return {};
}

}  // namespace vesk
