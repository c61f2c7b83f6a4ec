// Standard input by lines, and progress on standard error.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <optional>
#include <string>

namespace vesk {

/// Reads lines of at most 1 MiB from standard input. Skips empty lines.
class LineReader {
 public:
  /// The next line without its line feed; nullopt at the end of the input and after an error.
  std::optional<std::string> next();

  /// The number of the line that `next` returned last, starting at 1.
  std::uint64_t number() const noexcept { return _number; }
  /// Bytes read so far, for showing progress.
  std::uint64_t bytes() const noexcept { return _bytes; }
  /// Empty unless reading failed or a line was too long.
  const std::string& error() const noexcept { return _error; }

 private:
  std::uint64_t _number = 0;
  std::uint64_t _bytes = 0;
  std::string _error;
};

/// The width of lines, in characters: of $COLUMNS, otherwise of the terminal, otherwise 80.
std::size_t columns();

/// Whether standard output takes colours: a terminal, without $NO_COLOR.
bool takesColor();

/// Only drawn if standard error is a terminal, at most ten times a second.
class Progress {
 public:
  /// `input`: the descriptor being read; its size is known if it is a regular file.
  explicit Progress(int input) noexcept;

  void show(std::uint64_t items, std::uint64_t bytes);
  /// For work of unknown progress: shows a moving bar and the time since the construction.
  void showWaiting(const std::string& what);
  /// Clears the line for other output. Thread-safe.
  void clear();

 private:
  bool isDue();
  void draw(const std::string& line);

  const bool _isTerminal;
  const std::uint64_t _size;  ///< bytes; 0 if unknown
  const std::chrono::steady_clock::time_point _start = std::chrono::steady_clock::now();
  std::chrono::steady_clock::time_point _next = _start;
  std::atomic<bool> _isShown{false};
};

}  // namespace vesk
