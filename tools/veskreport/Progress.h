// A progress bar on standard error.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <string>
#include <string_view>

namespace vesk {

/// Only drawn if standard error is a terminal, at most ten times a second.
class Progress {
 public:
  /// `input`: the descriptor being read; its size is known if it is a regular file.
  explicit Progress(int input) noexcept;

  void show(std::uint64_t items, std::uint64_t bytes);
  /// For work of unknown progress: shows a moving bar and the time since the first call.
  void showWaiting(std::string_view what);
  /// Clears the line for other output. Thread-safe.
  void clear();

 private:
  const bool _isTerminal;
  const std::uint64_t _size;  ///< bytes; 0 if unknown
  bool isDue();
  void draw(const std::string& line);

  std::chrono::steady_clock::time_point _next{};
  std::chrono::steady_clock::time_point _first{};
  std::atomic<bool> _isShown{false};
};

}  // namespace vesk
