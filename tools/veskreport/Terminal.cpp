#include "tools/veskreport/Terminal.h"

#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
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

/// A bar with a block of `length` at `at`.
std::string bar(std::uint64_t at, std::uint64_t length) {
  return "[" + std::string(at, ' ') + std::string(length, '#') + std::string(kWidth - at - length, ' ') +
         "] ";
}

}  // namespace

std::optional<std::string> LineReader::next() {
  constexpr std::size_t kMaximumLine = std::size_t{1} << 20;
  while (_error.empty()) {
    std::string line;
    int c = 0;
    while (line.size() <= kMaximumLine && (c = ::getc_unlocked(stdin)) != EOF && c != '\n')
      line += static_cast<char>(c);
    if (c == EOF && std::ferror(stdin)) _error = std::strerror(errno);
    if (line.size() > kMaximumLine) _error = "line " + std::to_string(_number + 1) + " is longer than 1 MiB";
    if (!_error.empty() || (c == EOF && line.empty())) break;
    ++_number;
    _bytes += line.size() + 1;
    if (line.find_first_not_of(" \t\r") != std::string::npos) return line;
  }
  return std::nullopt;
}

std::size_t columns() {
  const char* wanted = std::getenv("COLUMNS");
  if (const long number = wanted ? std::strtol(wanted, nullptr, 10) : 0; number > 0)
    return static_cast<std::size_t>(number);
  winsize size{};
  return ::ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0 ? size.ws_col : 80;
}

bool takesColor() {
  const char* none = std::getenv("NO_COLOR");
  return ::isatty(STDOUT_FILENO) == 1 && (none == nullptr || *none == '\0');
}

Progress::Progress(int input) noexcept : _isTerminal(::isatty(STDERR_FILENO) == 1), _size(sizeOf(input)) {}

void Progress::show(std::uint64_t items, std::uint64_t bytes) {
  if (!isDue()) return;
  draw((_size > 0 ? bar(0, std::min(bytes, _size) * kWidth / _size) : "") + std::to_string(items) +
       " messages");
}

void Progress::showWaiting(const std::string& what) {
  if (!isDue()) return;
  const auto steps = static_cast<std::uint64_t>((_next - _start) / kInterval) - 1;
  // The block moves back and forth.
  const std::uint64_t way = kWidth - kBlock;
  const std::uint64_t at = steps / way % 2 == 0 ? steps % way : way - steps % way;
  draw(bar(at, kBlock) + what + ", " + std::to_string(steps * kInterval / std::chrono::seconds(1)) + " s");
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
