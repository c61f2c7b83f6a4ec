// Reads and writes whole files, and appends lines.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <filesystem>
#include <string>
#include <string_view>

namespace vesk {

/// Returns the contents of a regular file of at most `limit` bytes. Throws std::runtime_error with a message
/// that names the file and the cause.
std::string readWholeFile(const std::filesystem::path& path, std::size_t limit = std::size_t{16} << 20);

/// Replaces the file atomically: readers see the old or the new contents, and a failure keeps the old. The
/// new file has exactly `mode`. Throws std::runtime_error with a message that names the file and the cause.
void writeWholeFile(const std::filesystem::path& path, std::string_view contents, mode_t mode);

/// Appends all lines in one write or none of them, so that lines of different threads don't mix. Opens the
/// file each time, so that it may be moved away. Returns 0 or the error number.
[[nodiscard]] int appendLines(const std::filesystem::path& file, std::string_view lines);

}  // namespace vesk
