// Reads small files as a whole, such as configuration files or facts that the kernel exports.
#pragma once

#include <sys/stat.h>

#include <cstddef>
#include <functional>
#include <string>

#include "platform/result/Result.h"

namespace vesk {

/// Returns the bytes of the regular file at `path`, without adding the root prefix, if it has at most `limit`
/// bytes. Never blocks on other kinds of files. `check`, if set, says of the opened file whether it may be
/// read. The error's kind is Missing if there is no such file.
Result<std::string> readSmallFile(const std::string& path, std::size_t limit,
                                  const std::function<Result<void>(const struct stat&)>& check = {});

}  // namespace vesk
