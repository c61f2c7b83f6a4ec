// Reads files that are small or wrong.
#pragma once

#include <cstddef>
#include <string>

namespace vesk {

struct SmallFile {
  int error = 0;  ///< 0, or why it could not be read (errno; EFBIG when it is larger than allowed)
  std::string bytes;
};

/// Reads a regular file whole. Never waits (a FIFO in its place is an error), never reads past `limit` bytes.
SmallFile readSmallFile(const std::string& path, std::size_t limit);

}  // namespace vesk
