// The source of a storebag: a readable TOML or JSON file.
#pragma once

#include <filesystem>
#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// How a value of a wrong type is reported.
enum class StorebagChecks : unsigned char {
  Strict,  ///< an error
  Lenient  ///< a warning, for testing how a daemon handles it
};

struct StorebagSource {
  Dictionary payload;                 ///< `version`, `refresh_cycle` and the environment sections
  std::vector<std::string> warnings;  ///< lines that begin with the file's name
};

/// Reads a file of at most 1 MiB as TOML or JSON, depending on its extension (".toml" or ".json"). Throws
/// std::runtime_error with a message, possibly of several lines, that names the file and the key or line.
StorebagSource readStorebagSource(const std::filesystem::path& file,
                                  StorebagChecks checks = StorebagChecks::Strict);

}  // namespace vesk
