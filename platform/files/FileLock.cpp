#include "platform/files/FileLock.h"

#include <fcntl.h>
#include <sys/file.h>

#include <cerrno>
#include <thread>

#include "platform/files/PrivateFile.h"

namespace vesk {

namespace {

constexpr std::chrono::milliseconds kBetweenAttempts{10};

}  // namespace

Result<FileDescriptor> lockFile(const std::string& path, std::chrono::milliseconds patience) {
  auto file = makePrivateFile(path);
  if (!file && file.error().kind == Error::Kind::Exists)
    file = FileDescriptor(::open(path.c_str(), O_RDWR | O_CLOEXEC | O_NOFOLLOW));
  if (!file) return file;
  if (!*file) return systemError(errno);
  const auto deadline = std::chrono::steady_clock::now() + patience;
  while (::flock(file->get(), LOCK_EX | LOCK_NB) != 0) {
    const int cause = errno;
    if (cause != EWOULDBLOCK || std::chrono::steady_clock::now() >= deadline) return systemError(cause);
    std::this_thread::sleep_for(kBetweenAttempts);
  }
  return file;
}

}  // namespace vesk
