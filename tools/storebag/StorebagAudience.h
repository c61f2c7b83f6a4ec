// The clients and devices between which a storebag makes a difference.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "tools/storebag/StorebagEvaluation.h"

namespace vesk {

struct NamedSession {
  std::string name;  ///< for people: "Camera", or "other clients"
  StorebagSession session;
};

struct NamedDevice {
  // For people; what makes no difference is empty.
  std::string region;     ///< "in DE, FR", or what was said of the device
  std::string family{};   ///< "on Pine"
  std::string consent{};  ///< "without consent"
  StorebagDevice device{};
  bool isOfOneEnvironment = false;  ///< its facts say which
};

/// A session for each client and service that an entry of the HTTPS profiles names, for all others, and for
/// sessions that do not require user info.
std::vector<NamedSession> sessionsIn(const std::vector<Dictionary>& profiles);

/// A device for each group of regions and product families that all entries treat alike, with and without the
/// user's consent.
std::vector<NamedDevice> devicesIn(const std::vector<Dictionary>& profiles);

}  // namespace vesk
