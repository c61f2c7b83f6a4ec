#include "tools/veskreport/Lines.h"

#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace vesk {

namespace {

constexpr std::size_t kMaximumLine = std::size_t{1} << 20;
constexpr std::size_t kChunk = std::size_t{64} << 10;

}  // namespace

std::optional<std::string> LineReader::next() {
  while (_error.empty()) {
    auto line = takeLine();
    if (!line) {
      if (_isAtEnd) return std::nullopt;
      if (!fill()) continue;
    } else if (line->find_first_not_of(" \t\r") != std::string::npos) {
      return line;
    }
  }
  return std::nullopt;
}

std::optional<std::string> LineReader::takeLine() {
  std::size_t end = _buffer.find('\n', _at);
  bool isLast = end == std::string::npos && _isAtEnd && _at < _buffer.size();
  if (end == std::string::npos && !isLast) {
    if (_buffer.size() - _at > kMaximumLine)
      _error = "line " + std::to_string(_number + 1) + " is longer than 1 MiB";
    return std::nullopt;
  }
  std::string line = _buffer.substr(_at, end - _at);
  std::size_t taken = line.size() + (isLast ? 0 : 1);
  _at += taken;
  _bytes += taken;
  ++_number;
  return line;
}

// Returns false at the end of the input.
bool LineReader::fill() {
  _buffer.erase(0, _at);
  _at = 0;
  std::size_t before = _buffer.size();
  _buffer.resize(before + kChunk);
  ssize_t size;
  do {
    size = ::read(_descriptor, _buffer.data() + before, kChunk);
  } while (size < 0 && errno == EINTR);
  _buffer.resize(before + (size > 0 ? static_cast<std::size_t>(size) : 0));
  if (size < 0) _error = std::strerror(errno);
  _isAtEnd = size <= 0;
  return size > 0;
}

}  // namespace vesk
