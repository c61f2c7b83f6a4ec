#include "tools/veskreport/Progress.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <string>

namespace vesk {

namespace {

constexpr std::chrono::milliseconds kInterval{100};
constexpr std::uint64_t kWidth = 30;

std::uint64_t sizeOf(int input) noexcept {
  struct stat status {};
  if (::fstat(input, &status) != 0 || !S_ISREG(status.st_mode)) return 0;
  return static_cast<std::uint64_t>(std::max<off_t>(status.st_size, 0));
}

}  // namespace

Progress::Progress(int input) noexcept : _isTerminal(::isatty(STDERR_FILENO) == 1), _size(sizeOf(input)) {}

void Progress::show(std::uint64_t items, std::uint64_t bytes) {
  if (!_isTerminal) return;
  auto now = std::chrono::steady_clock::now();
  if (now < _next) return;
  _next = now + kInterval;
  std::string line;
  if (_size > 0) {
    auto filled = static_cast<std::size_t>(std::min(bytes, _size) * kWidth / _size);
    line = "[" + std::string(filled, '#') + std::string(kWidth - filled, ' ') + "] ";
  }
  std::fprintf(stderr, "\r\x1b[K%s%llu messages", line.c_str(), static_cast<unsigned long long>(items));
  std::fflush(stderr);
  _isShown = true;
}

void Progress::clear() {
  if (!_isShown.exchange(false)) return;
  std::fputs("\r\x1b[K", stderr);
  std::fflush(stderr);
}

}  // namespace vesk
