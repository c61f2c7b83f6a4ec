// Files to which the collector adds lines.
#pragma once

#include <filesystem>
#include <string_view>

namespace vesk {

/// Appends whole lines in one write, so that those of several threads do not mix: all of them, or none. The
/// file is opened each time, so that it may be moved away. 0, or the system's error number.
[[nodiscard]] int appendLines(const std::filesystem::path& file, std::string_view lines);

}  // namespace vesk
