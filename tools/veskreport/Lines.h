// Reads standard input line by line.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

namespace vesk {

/// Reads lines of at most 1 MiB from a descriptor, which it does not own. Skips empty lines.
class LineReader {
 public:
  explicit LineReader(int descriptor) noexcept : _descriptor(descriptor) {}

  /// The next line without its line end; nullopt at the end of the input and after an error.
  std::optional<std::string> next();

  /// The number of the line that `next` returned last, starting at 1.
  std::uint64_t number() const noexcept { return _number; }
  /// Bytes read so far, for showing progress.
  std::uint64_t bytes() const noexcept { return _bytes; }
  /// Empty unless reading failed or a line was too long.
  const std::string& error() const noexcept { return _error; }

 private:
  bool fill();
  std::optional<std::string> takeLine();

  const int _descriptor;
  std::string _buffer;
  std::size_t _at = 0;
  std::uint64_t _number = 0;
  std::uint64_t _bytes = 0;
  bool _isAtEnd = false;
  std::string _error;
};

}  // namespace vesk
