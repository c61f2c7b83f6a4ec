// Finds mistakes in a storebag that its single keys don't show.
#pragma once

#include <VeskReporting/values/Value.h>
#include "tools/storebag/StorebagFindings.h"

namespace vesk {

/// Asks the daemon's policy what it would decide: entries and filters that never apply, thresholds out of
/// order, events without a URL, environments in which nothing is reported. Values of a wrong type are left to
/// `checkStorebag`.
StorebagFindings reviewStorebag(const Dictionary& payload);

/// Whether a section's backend can be made from its profile.
bool isBuilt(std::string_view backend, const Value& profile);

}  // namespace vesk
