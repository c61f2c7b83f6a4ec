// Files to which the collector appends lines.
#pragma once

#include <filesystem>
#include <string_view>

namespace vesk {

/// Appends all lines in one write or none of them, so that lines of different threads don't mix. Opens the
/// file each time, so that it may be moved away. Returns 0 or the error number.
[[nodiscard]] int appendLines(const std::filesystem::path& file, std::string_view lines);

}  // namespace vesk
