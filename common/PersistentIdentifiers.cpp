#include "common/PersistentIdentifiers.h"

#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <string_view>
#include <system_error>

#include "platform/crypto/UUID.h"
#include "platform/files/FileLock.h"
#include "platform/files/PrivateFile.h"
#include "platform/files/RootPrefix.h"
#include "platform/files/SmallFile.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

constexpr std::size_t kMaximumFile = 4096;
constexpr char kRespecting[] = "respects_consent";
constexpr char kOverriding[] = "overrides_consent";

bool isIdentifier(std::string_view text) {
  if (text.size() != 36) return false;
  for (std::size_t i = 0; i < text.size(); ++i) {
    bool isDash = i == 8 || i == 13 || i == 18 || i == 23;
    if (isDash ? text[i] != '-' : std::isxdigit(static_cast<unsigned char>(text[i])) == 0) return false;
  }
  return true;
}

// The lock is only held while a small file is written.
constexpr std::chrono::milliseconds kPatience{500};

}  // namespace

std::string PersistentIdentifiers::identifier(bool respectsConsent) {
  MutexLock lock(_mutex);
  if (!_pair) _pair = load();
  return respectsConsent ? _pair->respecting : _pair->overriding;
}

void PersistentIdentifiers::renew() {
  MutexLock lock(_mutex);
  if (::unlink(_path.c_str()) != 0 && errno != ENOENT)
    VESK_LOG_WARNING("VeskReporting: cannot remove %s: %s", _path.c_str(), std::strerror(errno));
  _pair = load();
}

PersistentIdentifiers::Pair PersistentIdentifiers::load() const {
  // Usually the file is complete or absent, and reading it needs no lock.
  if (const auto file = readSmallFile(_path, kMaximumFile)) {
    if (auto known = parse(*file)) return *known;
  }
  std::error_code ignored;
  std::filesystem::create_directories(std::filesystem::path(_path).parent_path(), ignored);
  const auto lock = lockFile(_path + ".lock", kPatience);
  if (lock) {
    if (auto known = readFile()) return *known;
  }
  Pair pair{uuidText(makeUUID()), uuidText(makeUUID())};
  if (const auto stored = lock ? store(pair) : lock.error(); !stored) {
    VESK_LOG_WARNING("VeskReporting: cannot keep identifiers in %s: %s; they last as long as this process",
                     _path.c_str(), stored.error().text.c_str());
  }
  return pair;
}

// Reads the identifiers, and moves a file without usable ones out of the way.
std::optional<PersistentIdentifiers::Pair> PersistentIdentifiers::readFile() const {
  const auto file = readSmallFile(_path, kMaximumFile);
  if (!file && file.error().kind == Error::Kind::Missing) return std::nullopt;
  if (file) {
    if (auto pair = parse(*file)) return pair;
    VESK_LOG_WARNING("VeskReporting: %s holds no identifiers; kept as %s.bad, new ones are made",
                     _path.c_str(), _path.c_str());
  } else {
    VESK_LOG_WARNING("VeskReporting: cannot read %s: %s; kept as %s.bad, new identifiers are made",
                     _path.c_str(), file.error().text.c_str(), _path.c_str());
  }
  if (std::rename(_path.c_str(), (_path + ".bad").c_str()) != 0) {
    VESK_LOG_WARNING("VeskReporting: cannot rename %s: %s", _path.c_str(), std::strerror(errno));
  }
  return std::nullopt;
}

Result<void> PersistentIdentifiers::store(const Pair& pair) const {
  std::string text = "# Identifiers of this device, one for each consent mode. Made once; delete to renew.\n";
  text += std::string(kRespecting) + " = \"" + pair.respecting + "\"\n";
  text += std::string(kOverriding) + " = \"" + pair.overriding + "\"\n";
  return replacePrivateFile(_path, text);
}

// Parses what `store` writes: comments, blank lines and `key = "identifier"`.
std::optional<PersistentIdentifiers::Pair> PersistentIdentifiers::parse(const std::string& text) {
  Pair pair;
  for (std::size_t at = 0; at < text.size();) {
    std::size_t end = std::min(text.find('\n', at), text.size());
    std::string_view line(text.data() + at, end - at);
    at = end + 1;
    if (line.empty() || line.front() == '#') continue;
    std::size_t equals = line.find(" = \"");
    if (equals == std::string_view::npos || line.back() != '"') return std::nullopt;
    std::string_view value = line.substr(equals + 4);
    value.remove_suffix(value.empty() ? 0 : 1);
    if (!isIdentifier(value)) return std::nullopt;
    if (line.substr(0, equals) == kRespecting) pair.respecting = value;
    if (line.substr(0, equals) == kOverriding) pair.overriding = value;
  }
  if (pair.respecting.empty() || pair.overriding.empty()) return std::nullopt;
  return pair;
}

namespace {

PersistentIdentifiers& identifiersOfProcess() {
  // Never destroyed: another thread may still report while the process exits.
  static auto* identifiers =
      new PersistentIdentifiers(pathUnderRoot("/var/lib/veskreportingd/identifiers.toml"));
  return *identifiers;
}

}  // namespace

void renewPersistentIdentifiers() { identifiersOfProcess().renew(); }

std::string persistentIdentifierForDNU(bool respectsConsent) noexcept {
  try {
    return identifiersOfProcess().identifier(respectsConsent);
  } catch (...) {
    return {};
  }
}

}  // namespace vesk
