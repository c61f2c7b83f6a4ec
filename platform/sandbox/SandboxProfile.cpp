#include "platform/sandbox/SandboxProfile.h"

#include <linux/landlock.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <iterator>

#include "platform/files/RootPrefix.h"
#include "platform/preferences/TomlFile.h"
#include "platform/sandbox/Seccomp.h"

namespace vesk {

namespace {

namespace fs = std::filesystem;

constexpr std::uint64_t kRead = LANDLOCK_ACCESS_FS_READ_FILE | LANDLOCK_ACCESS_FS_READ_DIR;
constexpr std::uint64_t kWrite = kRead | LANDLOCK_ACCESS_FS_WRITE_FILE | LANDLOCK_ACCESS_FS_REMOVE_FILE |
                                 LANDLOCK_ACCESS_FS_REMOVE_DIR | LANDLOCK_ACCESS_FS_MAKE_REG |
                                 LANDLOCK_ACCESS_FS_MAKE_DIR;

struct PathKey {
  const char* name;
  std::uint64_t rights;
  bool isOptional;
  fs::perms created;
};
constexpr PathKey kPathKeys[] = {
    {"read", kRead, false, fs::perms::none},
    {"read-if-present", kRead, true, fs::perms::none},
    {"write", kWrite, false, fs::perms{0750}},
    {"sockets", kWrite | LANDLOCK_ACCESS_FS_MAKE_SOCK, false, fs::perms{0755}},
    {"remove-if-present", LANDLOCK_ACCESS_FS_REMOVE_FILE, true, fs::perms::none},
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

/// The items of a list; `item` returns nullopt for one that is not among `items`.
template <class T>
std::vector<T> listOf(const char* items, std::optional<T> (*item)(const Value&), const std::string& where,
                      const Value& value) {
  std::vector<T> result;
  if (!value.list()) fail(where, std::string("must be a list of ") + items);
  for (const Value& each : *value.list()) {
    auto converted = item(each);
    if (!converted) fail(where, std::string("must be a list of ") + items);
    result.push_back(*std::move(converted));
  }
  return result;
}

std::optional<std::string> text(const Value& value) {
  return value.text() ? std::optional(value.text()->string()) : std::nullopt;
}

std::optional<std::uint16_t> port(const Value& value) {
  const std::int64_t number = value.asInteger().value_or(0);
  return number >= 1 && number <= 65535 ? std::optional(static_cast<std::uint16_t>(number)) : std::nullopt;
}

void addPaths(std::vector<SandboxPath>& paths, const std::string& where, const DictionaryEntry& entry,
              bool underRoot) {
  const auto* key =
      std::ranges::find_if(kPathKeys, [&](const auto& known) { return entry.key == known.name; });
  if (key == std::end(kPathKeys)) fail(where, "unknown key");
  for (const std::string& written : listOf("strings", text, where, entry.value)) {
    if (!written.starts_with('/') && !written.starts_with('$')) {
      fail(where, inQuotes(written) + " is no absolute path");
    }
    std::string path = expanded(written);
    if (path.empty()) continue;
    paths.push_back({underRoot ? pathUnderRoot(path) : path, key->rights, key->isOptional, key->created});
  }
}

void readEntry(SandboxProfile& profile, const Text& table, const DictionaryEntry& entry) {
  const std::string where = table.string() + "." + entry.key.string();
  if (table == "machine" || table == "root") {
    addPaths(profile.paths, where, entry, table == "root");
  } else if (where == "network.connect") {
    profile.connectPorts = listOf("ports", port, where, entry.value);
  } else if (where == "calls.deny") {
    profile.deniedCalls = listOf("strings", text, where, entry.value);
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

}  // namespace vesk
