#include "platform/files/WriteAll.h"

#include <unistd.h>

#include <cerrno>

namespace vesk {

Result<void> writeAll(int descriptor, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::write(descriptor, bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return systemError(errno);
    if (count == 0) return systemError(EIO);  // no progress and no error: retrying might never end
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
  return {};
}

}  // namespace vesk
