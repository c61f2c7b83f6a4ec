// What is wrong with a storebag.
#pragma once

#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

struct StorebagFinding {
  enum class Kind : unsigned char {
    WrongType,   ///< the daemon treats the value as absent
    Impossible,  ///< the value has the right type, but can't have the effect that it is there for
    Doubtful,    ///< allowed, but probably a mistake
  };

  Kind kind = Kind::Doubtful;
  std::string place;  ///< such as "release.httpPost.clients[0].filters"; empty for the whole storebag
  std::string text;   ///< what is wrong and what follows from it

  bool isError() const { return kind != Kind::Doubtful; }
  /// "release.httpPost.clients[0].filters: must be a list of tables, is 3"
  std::string line() const { return place.empty() ? text : place + ": " + text; }
};

using StorebagFindings = std::vector<StorebagFinding>;

/// Checks each key of the payload by itself: its name, type and range, and what is missing.
StorebagFindings checkStorebag(const Dictionary& payload);

}  // namespace vesk
