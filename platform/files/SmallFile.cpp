#include "platform/files/SmallFile.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <system_error>

#include "platform/files/FileDescriptor.h"

namespace vesk {

namespace {

SmallFile failure(int code) {
  return {std::nullopt, code == ENOENT || code == ENOTDIR, std::generic_category().message(code)};
}

}  // namespace

SmallFile readSmallFile(const std::string& path, std::size_t limit,
                        const std::function<std::string(const struct stat&)>& objection) {
  // Without O_NONBLOCK, opening a FIFO would wait for a writer.
  FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  if (!file) return failure(errno);
  struct stat status {};
  if (::fstat(file.get(), &status) != 0) return failure(errno);
  if (!S_ISREG(status.st_mode)) return {std::nullopt, false, "not a regular file"};
  if (std::string reason = objection ? objection(status) : std::string(); !reason.empty())
    return {std::nullopt, false, std::move(reason)};

  // The size from fstat is only a hint: kernel files report 4096 or 0.
  std::string bytes;
  char chunk[8192];
  while (true) {
    ssize_t count = ::read(file.get(), chunk, sizeof chunk);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return failure(errno);
    if (count == 0) return {std::move(bytes), false, {}};
    if (bytes.size() + static_cast<std::size_t>(count) > limit) {
      return {std::nullopt, false, "larger than " + std::to_string(limit) + " bytes"};
    }
    bytes.append(chunk, static_cast<std::size_t>(count));
  }
}

}  // namespace vesk
