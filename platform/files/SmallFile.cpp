#include "platform/files/SmallFile.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>

#include "platform/files/FileDescriptor.h"

namespace vesk {

Result<std::string> readSmallFile(const std::string& path, std::size_t limit,
                                  const std::function<Result<void>(const struct stat&)>& check) {
  // Without O_NONBLOCK, opening a FIFO would wait for a writer.
  FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  if (!file) return systemError(errno);
  struct stat status {};
  if (::fstat(file.get(), &status) != 0) return systemError(errno);
  if (!S_ISREG(status.st_mode)) return Error{Error::Kind::Failed, "not a regular file"};
  if (auto checked = check ? check(status) : Result<void>(); !checked) return checked.error();

  // The size from fstat is only a hint: kernel files report 4096 or 0.
  std::string bytes;
  char chunk[8192];
  while (true) {
    ssize_t count = ::read(file.get(), chunk, sizeof chunk);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return systemError(errno);
    if (count == 0) return bytes;
    if (bytes.size() + static_cast<std::size_t>(count) > limit)
      return malformed("larger than " + std::to_string(limit) + " bytes");
    bytes.append(chunk, static_cast<std::size_t>(count));
  }
}

}  // namespace vesk
