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

/// Each finding is a line that begins with the place ("release.httpPost.clients[0].filters: …").
struct StorebagFindings {
  std::vector<std::string> errors;    ///< values of a wrong type, which the daemon treats as absent
  std::vector<std::string> warnings;  ///< allowed, but probably a mistake
};

/// Checks the payload of a storebag, with its environment sections, backends and their profiles.
StorebagFindings checkStorebag(const Dictionary& payload);

/// Reads a file of at most 1 MiB as TOML or JSON, depending on its extension (".toml" or ".json"). Throws
/// std::runtime_error with a message, possibly of several lines, that names the file and the key or line.
StorebagSource readStorebagSource(const std::filesystem::path& file,
                                  StorebagChecks checks = StorebagChecks::Strict);

/// The payload as a source. Reading it back gives an equal payload as far as the format allows: bytes become
/// base64 text; in JSON, dates become numbers, and infinities and NaN become text. Throws std::runtime_error
/// if the payload can't be represented.
std::string storebagAsJSON(const Dictionary& payload);
std::string storebagAsTOML(const Dictionary& payload);

}  // namespace vesk
