#include "tools/collector/LinesFile.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>

#include "platform/files/FileDescriptor.h"

namespace vesk {

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
