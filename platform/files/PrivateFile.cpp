#include "platform/files/PrivateFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>

#include "platform/files/WriteAll.h"

namespace vesk {

Result<FileDescriptor> makePrivateFile(const std::string& path) {
  FileDescriptor file(::open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
  if (!file) return systemError(errno);
  struct stat directory {};
  if (::geteuid() == 0 && ::stat(std::filesystem::path(path).parent_path().c_str(), &directory) == 0) {
    // Changes the owner of a newly created file only; an existing file could be anyone's. If this is not
    // permitted, root keeps the file.
    static_cast<void>(::fchown(file.get(), directory.st_uid, directory.st_gid) == 0);
  }
  return file;
}

Result<void> replacePrivateFile(const std::string& path, std::string_view bytes) {
  // A leftover of a crashed process is overwritten.
  const std::string temporary = path + ".new";
  ::unlink(temporary.c_str());
  const auto file = makePrivateFile(temporary);
  if (!file) return file.error();
  auto stored = writeAll(file->get(), bytes);
  if (stored && (::fsync(file->get()) != 0 || std::rename(temporary.c_str(), path.c_str()) != 0))
    stored = systemError(errno);
  if (!stored) ::unlink(temporary.c_str());
  return stored;
}

}  // namespace vesk
