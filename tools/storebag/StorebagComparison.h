// What a new storebag changes for clients and devices.
#pragma once

#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "tools/storebag/StorebagAudience.h"

namespace vesk {

struct StorebagChange {
  std::string environment;
  std::string backend;
  std::string clients;  ///< empty for backends that treat all alike, as are the devices
  std::string devices;
  std::string text;  ///< such as "starts to report for 50 % of the sessions"

  /// "release: httpPost: Camera: in DE: starts to report for 50 % of the sessions"
  std::string line() const;
};

/// Decides about each client on each device with both storebags, and returns the differences. Without
/// devices, uses those of `devicesIn`.
std::vector<StorebagChange> compareStorebags(const Dictionary& before, const Dictionary& after,
                                             const std::vector<NamedDevice>& devices);

}  // namespace vesk
