#include "common/Resources.h"

#include <algorithm>
#include <filesystem>
#include <string_view>
#include <system_error>

#include "platform/files/RootPrefix.h"
#include "platform/files/TrustedFile.h"
#include "platform/log/SystemLog.h"
#include "platform/text/ASCII.h"

namespace vesk {

namespace {

constexpr std::size_t kMaximumVersionFile = 4096;
constexpr std::size_t kMaximumVersion = 64;
constexpr char kResources[] = "/usr/share/veskreporting/";
constexpr std::size_t kMaximumPublicKeys = 16;
constexpr std::size_t kMaximumPublicKey = std::size_t{64} << 10;

/// Reads one of the library's installed files.
std::optional<std::string> readResource(const std::string& name, std::size_t limit) {
  std::string path = pathUnderRoot(kResources) + name;
  auto bytes = readTrustedFile(path, limit);
  if (bytes) return *std::move(bytes);
  const Error& error = bytes.error();
  if (error.kind != Error::Kind::Missing && error.kind != Error::Kind::Untrusted)
    VESK_LOG_WARNING("VeskReporting: cannot read %s: %s", path.c_str(), error.text.c_str());
  return std::nullopt;
}

// The version is put into a URL unescaped, so it must be a single printable word.
bool isUsableVersion(std::string_view version) {
  return !version.empty() && version.size() <= kMaximumVersion &&
         std::all_of(version.begin(), version.end(), [](char c) { return c > ' ' && c < 0x7f; });
}

/// The first line of the file "version", trimmed; nullopt if the file is missing or its version is unusable.
std::optional<std::string> declaredVersion() {
  auto file = readResource("version", kMaximumVersionFile);
  if (!file) return std::nullopt;
  std::string_view text = trimmed(*file);
  std::string_view version = trimmed(text.substr(0, text.find('\n')));
  if (isUsableVersion(version)) return std::string(version);
  VESK_LOG_WARNING("VeskReporting: the file \"version\" holds no version");
  return std::nullopt;
}

}  // namespace

std::string clientLibraryVersion() noexcept {
  constexpr char kDefaultVersion[] = "7.0";  // short enough to need no allocation
  try {
    return declaredVersion().value_or(kDefaultVersion);
  } catch (...) {
    return kDefaultVersion;
  }
}

std::vector<std::string> publicKeysDER() {
  std::vector<std::string> names{"publicKey.der"};
  std::error_code none;
  for (const auto& file :
       std::filesystem::directory_iterator(pathUnderRoot(kResources) + "publicKeys", none)) {
    if (file.path().extension() == ".der") names.push_back("publicKeys/" + file.path().filename().string());
  }
  std::sort(names.begin() + 1, names.end());
  if (names.size() > kMaximumPublicKeys) names.resize(kMaximumPublicKeys);
  std::vector<std::string> keys;
  for (const auto& name : names) {
    if (auto key = readResource(name, kMaximumPublicKey)) keys.push_back(*std::move(key));
  }
  return keys;
}

std::optional<std::string> publicKeyDER() noexcept {
  try {
    auto key = readResource("publicKey.der", kMaximumPublicKey);
    if (key && key->empty()) return std::nullopt;
    return key;
  } catch (...) {
    return std::nullopt;
  }
}

}  // namespace vesk
