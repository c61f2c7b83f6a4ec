// The source of a storebag: a readable TOML or JSON file.
#pragma once

#include <filesystem>
#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "tools/storebag/StorebagFindings.h"

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

/// Reads such a file without checking what it holds. Throws like `readStorebagSource`.
Dictionary readTomlOrJSON(const std::filesystem::path& file);

/// The payload of a source, or of a signed document, whose signature is not verified. Throws like
/// `readStorebagSource`.
Dictionary readAnyStorebag(const std::filesystem::path& file);

/// The payload as a source. Reading it back gives an equal payload as far as the format allows: bytes become
/// base64 text; in JSON, dates become numbers, and infinities and NaN become text. Throws std::runtime_error
/// if the payload can't be represented.
std::string storebagAsJSON(const Dictionary& payload);
std::string storebagAsTOML(const Dictionary& payload);

}  // namespace vesk
