// A storebag as a person writes it: a readable TOML or JSON file.
#pragma once

#include <filesystem>
#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// What a value of a wrong type is.
enum class StorebagChecks : unsigned char {
  Strict,  ///< an error
  Lenient  ///< one more warning: to try out what a daemon makes of it
};

struct StorebagSource {
  Dictionary payload;                 ///< `version`, `refresh_cycle` and the environment sections
  std::vector<std::string> warnings;  ///< lines that begin with the file's name
};

/// Reads the file, of at most 1 MiB, by the kind that its name ends in: ".toml" or ".json". Throws
/// std::runtime_error with a message, possibly of several lines, that names the file and the key or the line.
StorebagSource readStorebagSource(const std::filesystem::path& file,
                                  StorebagChecks checks = StorebagChecks::Strict);

}  // namespace vesk
