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
constexpr std::uint64_t kBlock = 6;

std::uint64_t sizeOf(int input) noexcept {
  struct stat status {};
  if (::fstat(input, &status) != 0 || !S_ISREG(status.st_mode)) return 0;
  return static_cast<std::uint64_t>(std::max<off_t>(status.st_size, 0));
}

}  // namespace

Progress::Progress(int input) noexcept : _isTerminal(::isatty(STDERR_FILENO) == 1), _size(sizeOf(input)) {}

void Progress::show(std::uint64_t items, std::uint64_t bytes) {
  if (!isDue()) return;
  std::string line;
  if (_size > 0) {
    auto filled = static_cast<std::size_t>(std::min(bytes, _size) * kWidth / _size);
    line = "[" + std::string(filled, '#') + std::string(kWidth - filled, ' ') + "] ";
  }
  draw(line + std::to_string(items) + " messages");
}

void Progress::showWaiting(std::string_view what) {
  if (!isDue()) return;
  if (_first == std::chrono::steady_clock::time_point{}) _first = _next;
  const auto steps = static_cast<std::uint64_t>((_next - _first) / kInterval);
  // The block moves back and forth.
  const std::uint64_t way = kWidth - kBlock;
  const std::uint64_t at = steps / way % 2 == 0 ? steps % way : way - steps % way;
  draw("[" + std::string(at, ' ') + std::string(kBlock, '#') + std::string(way - at, ' ') + "] " +
       std::string(what) + ", " + std::to_string(steps * kInterval / std::chrono::seconds(1)) + " s");
}

bool Progress::isDue() {
  if (!_isTerminal) return false;
  auto now = std::chrono::steady_clock::now();
  if (now < _next) return false;
  _next = now + kInterval;
  return true;
}

void Progress::draw(const std::string& line) {
  std::fprintf(stderr, "\r\x1b[K%s", line.c_str());
  std::fflush(stderr);
  _isShown = true;
}

void Progress::clear() {
  if (!_isShown.exchange(false)) return;
  std::fputs("\r\x1b[K", stderr);
  std::fflush(stderr);
}

}  // namespace vesk
