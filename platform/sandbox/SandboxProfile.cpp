#include "platform/sandbox/SandboxProfile.h"

#include <cstdlib>
#include <filesystem>
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

/// Thrown inside this file only.
struct BadProfile {
  std::string error;
};

[[noreturn]] void fail(const std::string& where, const std::string& what) {
  throw BadProfile{where + ": " + what};
}

std::string inQuotes(std::string_view text) { return "\"" + std::string(text) + "\""; }

/// The path with its variable replaced and its dots resolved; empty when the variable is of no use.
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
  const PathKey* key = nullptr;
  for (const PathKey& known : kPathKeys) {
    if (entry.key == known.name) key = &known;
  }
  if (!key) fail(where, "unknown key");
  for (const std::string& written : texts(where, entry.value)) {
    if (!written.starts_with('/') && !written.starts_with('$')) {
      fail(where, inQuotes(written) + " is no absolute path");
    }
    std::string path = expanded(written);
    if (path.empty()) continue;
    paths.push_back({underRoot ? pathUnderRoot(path) : path, key->access, key->optional});
  }
}

const Dictionary& table(const DictionaryEntry& entry) {
  const Dictionary* dictionary = entry.value.dictionary();
  if (!dictionary) fail(entry.key.string(), "must be a table");
  return *dictionary;
}

bool isRequired(const Value& value) {
  if (value == Value("required")) return true;
  if (value == Value("if-available")) return false;
  fail("landlock", "must be \"required\" or \"if-available\"");
}

std::vector<std::uint16_t> connectPorts(const Dictionary& network) {
  std::vector<std::uint16_t> ports;
  for (const DictionaryEntry& entry : network) {
    const std::string where = "network." + entry.key.string();
    if (!(entry.key == "connect")) fail(where, "unknown key");
    const List* list = entry.value.list();
    if (!list) fail(where, "must be a list of ports");
    for (const Value& port : *list) {
      const std::int64_t number = port.asInteger().value_or(0);
      if (number < 1 || number > 65535) fail(where, "must be a list of ports");
      ports.push_back(static_cast<std::uint16_t>(number));
    }
  }
  return ports;
}

std::vector<std::string> deniedCalls(const Dictionary& calls) {
  std::vector<std::string> groups;
  for (const DictionaryEntry& entry : calls) {
    std::string where = "calls." + entry.key.string();
    if (!(entry.key == "deny")) fail(where, "unknown key");
    groups = texts(where, entry.value);
    for (const std::string& group : groups) {
      if (!isCallGroup(group)) fail(where, "unknown group " + inQuotes(group));
    }
  }
  return groups;
}

SandboxProfile profileFrom(const Dictionary& document) {
  SandboxProfile profile;
  for (const DictionaryEntry& entry : document) {
    if (entry.key == "landlock") {
      profile.landlockRequired = isRequired(entry.value);
    } else if (entry.key == "machine" || entry.key == "root") {
      for (const DictionaryEntry& paths : table(entry)) {
        addPaths(profile.paths, entry.key.string() + "." + paths.key.string(), paths, entry.key == "root");
      }
    } else if (entry.key == "network") {
      profile.connectPorts = connectPorts(table(entry));
    } else if (entry.key == "calls") {
      profile.deniedCalls = deniedCalls(table(entry));
    } else {
      fail(entry.key.string(), "unknown key");
    }
  }
  return profile;
}

}  // namespace

SandboxProfileOutcome parseSandboxProfile(std::string_view toml) {
  TomlOutcome outcome = parseToml(toml);
  if (!outcome.document) return {std::nullopt, std::move(outcome.error)};
  try {
    return {profileFrom(*outcome.document), {}};
  } catch (BadProfile& bad) {
    return {std::nullopt, std::move(bad.error)};
  }
}

std::optional<std::string> makeDirectories(const std::vector<SandboxPath>& paths) {
  for (const SandboxPath& path : paths) {
    if (path.access == SandboxPath::Access::Read || path.optional) continue;
    std::error_code error;
    if (fs::exists(path.path, error)) continue;
    fs::create_directories(path.path, error);
    auto mode = path.access == SandboxPath::Access::Sockets ? fs::perms{0755} : fs::perms{0750};
    if (!error) fs::permissions(path.path, mode, error);
    if (error) return path.path + ": " + error.message();
  }
  return std::nullopt;
}

}  // namespace vesk
