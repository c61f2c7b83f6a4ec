#include "tools/collector/StorebagFolder.h"

#include <algorithm>

namespace vesk {

namespace {

bool isPlainName(std::string_view name) {
  auto isPlain = [](char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-' || c == '_';
  };
  return !name.empty() && name.size() <= 100 && std::all_of(name.begin(), name.end(), isPlain);
}

}  // namespace

std::optional<StorebagFolder::Found> StorebagFolder::find(std::string_view name) {
  if (!isPlainName(name)) return std::nullopt;
  struct stat status {};
  std::filesystem::path file = _directory / (std::string(name) + ".toml");
  if (::stat(file.c_str(), &status) != 0) file.replace_extension(".json");
  if (::stat(file.c_str(), &status) != 0) return std::nullopt;

  MutexLock lock(_mutex);
  auto [entry, isFirst] = _versions.try_emplace(file);
  Version& version = entry->second;
  bool isSame = !isFirst && version.size == status.st_size && version.inode == status.st_ino &&
                version.modified.tv_sec == status.st_mtim.tv_sec &&
                version.modified.tv_nsec == status.st_mtim.tv_nsec;
  if (!isSame) {
    std::time_t after = isFirst ? status.st_mtim.tv_sec : version.lastModified + 1;
    version = {status.st_mtim, status.st_size, status.st_ino, std::max(after, status.st_mtim.tv_sec)};
  }
  return Found{file, version.lastModified, !isSame};
}

}  // namespace vesk
