// Checks storebags for their authors.
#pragma once

#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// Each finding is a line that begins with the place ("release.httpPost.clients[0].filters: …").
struct StorebagFindings {
  std::vector<std::string> errors;    ///< values of a wrong type, which the daemon treats as absent
  std::vector<std::string> warnings;  ///< allowed, but probably a mistake
};

/// Checks the payload of a storebag, with its environment sections, backends and their profiles.
StorebagFindings checkStorebag(const Dictionary& payload);

}  // namespace vesk
