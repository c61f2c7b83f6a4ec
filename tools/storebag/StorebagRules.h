// What a storebag may hold, for those who write one.
#pragma once

#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// What was found, each a line that begins with the place ("release.httpPost.clients[0].filters: …").
struct StorebagFindings {
  std::vector<std::string> errors;    ///< values of a wrong type: the daemon counts them as absent
  std::vector<std::string> warnings;  ///< what is probably a mistake, though it is allowed
};

/// Checks the payload of a storebag, with its environment sections, backends and their profiles.
StorebagFindings checkStorebag(const Dictionary& payload);

}  // namespace vesk
