#include "platform/files/TrustedFile.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <set>
#include <utility>

#include "platform/files/RootPrefix.h"
#include "platform/log/SystemLog.h"
#include "platform/sync/Mutex.h"

namespace vesk {

namespace {

Error untrusted(std::string reason) { return {Error::Kind::Untrusted, std::move(reason)}; }

Result<void> checkTrust(const struct stat& status, TrustedOwner owner) {
  const bool mayBeOwn = owner == TrustedOwner::OwnUser || !rootPrefix().empty();
  if (status.st_uid != 0 && !(mayBeOwn && status.st_uid == ::geteuid()))
    return untrusted("it belongs to user " + std::to_string(status.st_uid));
  if ((status.st_mode & (S_IWGRP | S_IWOTH)) == 0) return {};
  char mode[8];
  std::snprintf(mode, sizeof mode, "%04o", static_cast<unsigned>(status.st_mode & 07777));
  return untrusted(std::string("others than its owner can write to it (mode ") + mode + ")");
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

Result<std::string> readTrustedFile(const std::string& path, std::size_t limit, TrustedOwner owner) {
  auto bytes =
      readSmallFile(path, limit, [&](const struct stat& status) { return checkTrust(status, owner); });
  if (!bytes && bytes.error().kind == Error::Kind::Untrusted) reportOnce(path, bytes.error().text);
  return bytes;
}

}  // namespace vesk
