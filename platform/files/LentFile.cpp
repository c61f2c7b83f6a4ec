#include "platform/files/LentFile.h"

#include <fcntl.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <system_error>

namespace vesk {

namespace {

constexpr std::size_t kPiece = std::size_t{1} << 20;

}  // namespace

LentFile::LentFile(FileDescriptor descriptor) noexcept : _descriptor(std::move(descriptor)) {
  if (_descriptor && ::fstat(_descriptor.get(), &_status) != 0) _status = {};
}

bool LentFile::isRegularAt(const std::string& path) const {
  if (!S_ISREG(_status.st_mode) || _status.st_nlink == 0 || path.empty()) return false;
  struct stat named {};
  if (::lstat(path.c_str(), &named) == 0) return S_ISREG(named.st_mode);
  if (errno != ENOENT) return true;
  const std::string parent = path.substr(0, path.rfind('/') + 1);
  // If the file is missing there, the client may see another directory under that path, as with PrivateTmp=.
  // The kernel knows the path by which the client opened the file.
  return ::stat(parent.c_str(), &named) != 0 || wasOpenedAt(path);
}

bool LentFile::wasOpenedAt(const std::string& path) const {
  std::error_code unknown;
  const auto opened =
      std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(_descriptor.get()), unknown);
  return opened == std::filesystem::path(path).lexically_normal();
}

Result<std::string> LentFile::read(const std::function<bool()>& goOn) const {
  std::string bytes(size(), '\0');
  std::size_t done = 0;
  while (done < bytes.size()) {
    if (!goOn()) return Error{Error::Kind::TimedOut, "not read in time"};
    const std::size_t piece = std::min(bytes.size() - done, kPiece);
    ssize_t count = ::pread(_descriptor.get(), bytes.data() + done, piece, static_cast<off_t>(done));
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return systemError(errno);
    if (count == 0) return malformed("shorter than before");
    done += static_cast<std::size_t>(count);
  }
  return bytes;
}

bool LentFile::removeFrom(const std::string& path, uid_t user) const {
  if (user != _status.st_uid && user != ::geteuid()) return false;
  auto slash = path.rfind('/');
  if (slash == std::string::npos) return false;
  // Holds the directory open, so that both steps use the same one even if its path changes.
  const std::string parent(path, 0, slash + 1);
  FileDescriptor directory(::open(parent.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
  if (!directory) return false;
  const char* name = path.c_str() + slash + 1;
  struct stat named {};
  if (::fstatat(directory.get(), name, &named, AT_SYMLINK_NOFOLLOW) != 0) return false;
  if (named.st_dev != _status.st_dev || named.st_ino != _status.st_ino || !isUnchanged(named)) return false;
  return ::unlinkat(directory.get(), name, 0) == 0;
}

bool LentFile::isUnchanged(const struct stat& now) const noexcept {
  return now.st_size == _status.st_size && now.st_mtim.tv_sec == _status.st_mtim.tv_sec &&
         now.st_mtim.tv_nsec == _status.st_mtim.tv_nsec;
}

}  // namespace vesk
