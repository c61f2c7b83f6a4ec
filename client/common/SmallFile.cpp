#include "client/common/SmallFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "platform/files/FileDescriptor.h"

namespace vesk {

SmallFile readSmallFile(const std::string& path, std::size_t limit) {
  FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  if (!file) return {errno, {}};
  struct stat status {};
  if (::fstat(file.get(), &status) != 0) return {errno, {}};
  if (!S_ISREG(status.st_mode)) return {EINVAL, {}};

  std::string bytes;
  char buffer[4096];
  for (;;) {
    ssize_t size = ::read(file.get(), buffer, sizeof buffer);
    if (size < 0 && errno == EINTR) continue;
    if (size < 0) return {errno, {}};
    if (size == 0) return {0, std::move(bytes)};
    bytes.append(buffer, static_cast<std::size_t>(size));
    if (bytes.size() > limit) return {EFBIG, {}};
  }
}

}  // namespace vesk
