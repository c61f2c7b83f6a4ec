// A progress bar on standard error.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <string>
#include <string_view>

namespace vesk {

/// Shows itself only when standard error is a terminal, at most ten times a second.
class Progress {
 public:
  /// `input`: what is worked through; its size is known when it is a regular file.
  explicit Progress(int input) noexcept;

  void show(std::uint64_t items, std::uint64_t bytes);
  /// For work whose progress nobody tells: a bar that moves, and the time since the first call.
  void showWaiting(std::string_view what);
  /// Leaves the line empty for other output. For any thread.
  void clear();

 private:
  const bool _isTerminal;
  const std::uint64_t _size;  ///< bytes; 0 when unknown
  bool isDue();
  void draw(const std::string& line);

  std::chrono::steady_clock::time_point _next{};
  std::chrono::steady_clock::time_point _first{};
  std::atomic<bool> _isShown{false};
};

}  // namespace vesk
