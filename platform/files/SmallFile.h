// Reading a whole small file, such as a configuration or a fact that the kernel exports.
#pragma once

#include <sys/stat.h>

#include <cstddef>
#include <functional>
#include <optional>
#include <string>

namespace vesk {

/// What came of reading a file: its bytes, or why not. Not there and not readable are different outcomes.
struct SmallFile {
  std::optional<std::string> bytes;
  bool missing = false;   ///< there is no such file
  std::string error{};    ///< one clause for a log line when there are no bytes
  bool reported = false;  ///< the error has been logged
};

/// Reads the regular file at `path` (as it is: no root prefix is added) when it has at most `limit` bytes.
/// Never blocks on what is no regular file. `objection`, when given, checks the opened file and returns why
/// it must not be read, or "".
SmallFile readSmallFile(const std::string& path, std::size_t limit,
                        const std::function<std::string(const struct stat&)>& objection = {});

}  // namespace vesk
