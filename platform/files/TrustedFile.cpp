#include "platform/files/TrustedFile.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <set>

#include "platform/files/RootPrefix.h"
#include "platform/log/SystemLog.h"
#include "platform/sync/Mutex.h"

namespace vesk {

namespace {

/// The reason why the file is not trusted; "" if it is trusted.
std::string distrust(const struct stat& status, TrustedOwner owner) {
  const bool mayBeOwn = owner == TrustedOwner::OwnUser || !rootPrefix().empty();
  if (status.st_uid != 0 && !(mayBeOwn && status.st_uid == ::geteuid()))
    return "it belongs to user " + std::to_string(status.st_uid);
  if ((status.st_mode & (S_IWGRP | S_IWOTH)) == 0) return {};
  char mode[8];
  std::snprintf(mode, sizeof mode, "%04o", static_cast<unsigned>(status.st_mode & 07777));
  return std::string("others than its owner can write to it (mode ") + mode + ")";
}

void reportOnce(const std::string& path, const std::string& reason) {
  static Mutex mutex;
  static std::set<std::string>& reported = *new std::set<std::string>;  // never destroyed
  {
    MutexLock lock(mutex);
    if (!reported.insert(path + '\n' + reason).second) return;
  }
  VESK_LOG_WARNING("%s is refused: %s", path.c_str(), reason.c_str());
}

}  // namespace

SmallFile readTrustedFile(const std::string& path, std::size_t limit, TrustedOwner owner) {
  std::string reason;
  SmallFile file =
      readSmallFile(path, limit, [&](const struct stat& status) { return reason = distrust(status, owner); });
  if (reason.empty()) return file;
  file.reported = true;
  reportOnce(path, reason);
  return file;
}

}  // namespace vesk
