#include "platform/log/StandardError.h"

#include <poll.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <climits>
#include <csignal>

#include "platform/unicode/UTF8.h"

namespace vesk {

namespace {

/// Suppresses SIGPIPE for this thread and leaves the process's handling of the signal alone.
class NoBrokenPipe {
 public:
  NoBrokenPipe() noexcept {
    sigset_t pending;
    ::sigpending(&pending);
    _wasPending = ::sigismember(&pending, SIGPIPE) == 1;
    ::sigemptyset(&_signal);
    ::sigaddset(&_signal, SIGPIPE);
    ::pthread_sigmask(SIG_BLOCK, &_signal, &_before);
  }
  ~NoBrokenPipe() { ::pthread_sigmask(SIG_SETMASK, &_before, nullptr); }
  NoBrokenPipe(const NoBrokenPipe&) = delete;
  NoBrokenPipe& operator=(const NoBrokenPipe&) = delete;

  /// Call after a write has raised the signal, so that it is not delivered when this object is destroyed.
  void takeBack() noexcept {
    const timespec atOnce{};
    while (!_wasPending && ::sigtimedwait(&_signal, nullptr, &atOnce) < 0 && errno == EINTR) {
    }
  }

 private:
  sigset_t _signal{};
  sigset_t _before{};
  bool _wasPending = false;
};

bool hasRoom(std::chrono::milliseconds patience) noexcept {
  static std::atomic<bool> isStuck{false};
  pollfd standardError{STDERR_FILENO, POLLOUT, 0};
  const int limit = isStuck.load(std::memory_order_relaxed) ? 0 : static_cast<int>(patience.count());
  int ready = 0;
  do {
    ready = ::poll(&standardError, 1, limit);
  } while (ready < 0 && errno == EINTR);
  isStuck.store(ready == 0, std::memory_order_relaxed);
  return standardError.revents == POLLOUT;  // an error beside it means that the reader is gone
}

}  // namespace

void writeToStandardError(std::string line, std::chrono::milliseconds patience) {
  constexpr char kCut[] = "...";
  if (patience <= patience.zero() && line.size() >= PIPE_BUF) {
    line = cutToWholeCharacters(line, PIPE_BUF - sizeof kCut) + kCut;
  }
  line += '\n';
  if (!hasRoom(patience)) return;
  NoBrokenPipe signal;
  if (::write(STDERR_FILENO, line.data(), line.size()) < 0 && errno == EPIPE) signal.takeBack();
}

}  // namespace vesk
