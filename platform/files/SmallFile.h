// Reads small files as a whole, such as configuration files or facts that the kernel exports.
#pragma once

#include <sys/stat.h>

#include <cstddef>
#include <functional>
#include <optional>
#include <string>

namespace vesk {

/// The bytes of a file, or why it was not read. A missing file and an unreadable one are different outcomes.
struct SmallFile {
  std::optional<std::string> bytes;
  bool missing = false;   ///< the file does not exist
  std::string error{};    ///< a clause for a log line if there are no bytes
  bool reported = false;  ///< the error has been logged
};

/// Reads the regular file at `path`, without adding the root prefix, if it has at most `limit` bytes. Never
/// blocks on other kinds of files. `objection`, if set, checks the opened file and returns why it must not be
/// read, or "".
SmallFile readSmallFile(const std::string& path, std::size_t limit,
                        const std::function<std::string(const struct stat&)>& objection = {});

}  // namespace vesk
