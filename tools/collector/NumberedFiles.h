// Saves received files.
#pragma once

#include <atomic>
#include <cstdint>
#include <filesystem>
#include <string>
#include <string_view>

namespace vesk {

/// Saves files in one directory, each under a number that is not used there yet. Thread-safe.
class NumberedFiles {
 public:
  /// `directory` is created with the first file.
  explicit NumberedFiles(std::filesystem::path directory) : _directory(std::move(directory)) {}

  /// Saves `bytes` under the next number, followed by `ending`, and returns the path. Throws
  /// std::runtime_error.
  std::filesystem::path save(std::string_view bytes, const std::string& ending);

 private:
  const std::filesystem::path _directory;
  std::atomic<std::uint64_t> _last = 0;
};

}  // namespace vesk
