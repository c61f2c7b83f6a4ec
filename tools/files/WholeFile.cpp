#include "tools/files/WholeFile.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <stdexcept>

#include "platform/files/FileDescriptor.h"
#include "platform/files/SmallFile.h"
#include "platform/files/WriteAll.h"

namespace vesk {

std::string readWholeFile(const std::filesystem::path& path, std::size_t limit) {
  auto bytes = readSmallFile(path.string(), limit);
  if (!bytes) throw std::runtime_error("can't read " + path.string() + ": " + bytes.error().text);
  return *std::move(bytes);
}

void writeWholeFile(const std::filesystem::path& path, std::string_view contents, mode_t mode) {
  std::string fresh = path.string() + ".XXXXXX";
  FileDescriptor file(::mkostemp(fresh.data(), O_CLOEXEC));
  Result<void> written;
  if (!file || ::fchmod(file.get(), mode) != 0) written = systemError(errno);
  if (written) written = writeAll(file.get(), contents);
  if (written && (::fsync(file.get()) != 0 || ::rename(fresh.c_str(), path.c_str()) != 0))
    written = systemError(errno);
  if (written) return;
  if (file) ::unlink(fresh.c_str());
  throw std::runtime_error("can't write " + path.string() + ": " + written.error().text);
}

int appendLines(const std::filesystem::path& path, std::string_view lines) {
  FileDescriptor file(::open(path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644));
  if (!file) return errno;
  // Others also append to the file. They must not write before a torn line is removed.
  ::flock(file.get(), LOCK_EX);
  ssize_t written = ::write(file.get(), lines.data(), lines.size());
  if (written < 0) return errno;
  if (static_cast<std::size_t>(written) == lines.size()) return 0;
  const off_t end = ::lseek(file.get(), 0, SEEK_CUR);
  return ::ftruncate(file.get(), end - written) == 0 ? ENOSPC : errno;
}

}  // namespace vesk
