// Examples of what a storebag must do, which are checked with the daemon's code.
#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "platform/result/Result.h"
#include "tools/storebag/StorebagEvaluation.h"

namespace vesk {

struct StorebagCase {
  std::string name;
  StorebagSession session;
  StorebagDevice device;
  StorebagMessage message;
  std::string backend = "httpPost";
  Dictionary expect;  ///< state, url, fields, removed
};

struct StorebagCases {
  std::optional<std::filesystem::path> storebag;  ///< that the document names
  Dictionary device;                              ///< facts that hold for every case
  List cases;                                     ///< not yet read
};

/// Reads the document of the file. Fails for unknown keys and wrong types, with the key's place. Throws
/// std::runtime_error if the file can't be read.
Result<StorebagCases> storebagCasesIn(const std::filesystem::path& file);

/// Reads one of the cases. A session of a client type that it doesn't give has `clientType`. Fails and throws
/// as above; paths are relative to `directory`.
Result<StorebagCase> storebagCaseAt(const StorebagCases& all, std::size_t index, std::int32_t clientType,
                                    const std::filesystem::path& directory);

/// The client type that uses the storebag: the first of those that its key `name` permits.
std::int32_t clientTypeFor(const Dictionary& payload);

/// What is not as the case expects, one text each; empty if it holds.
std::vector<std::string> failuresOf(const StorebagCase& tested, const Dictionary& payload);

}  // namespace vesk
