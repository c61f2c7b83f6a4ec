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

int lockFile(FileDescriptor& lock, const std::string& path, std::chrono::milliseconds patience) {
  lock.reset();
  FileDescriptor file = makePrivateFile(path);
  if (!file && errno == EEXIST) file = FileDescriptor(::open(path.c_str(), O_RDWR | O_CLOEXEC | O_NOFOLLOW));
  if (!file) return errno;
  const auto deadline = std::chrono::steady_clock::now() + patience;
  while (::flock(file.get(), LOCK_EX | LOCK_NB) != 0) {
    const int cause = errno;
    if (cause != EWOULDBLOCK || std::chrono::steady_clock::now() >= deadline) return cause;
    std::this_thread::sleep_for(kBetweenAttempts);
  }
  lock = std::move(file);
  return 0;
}

}  // namespace vesk
