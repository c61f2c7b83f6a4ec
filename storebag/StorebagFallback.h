// The storebag that stands in for one that can't be reached.
#pragma once

#include <VeskReporting/values/Value.h>

namespace vesk {

/// The payload that is used for the storebag "palvo" when its server can't be reached. Unsigned; without a
/// section "seed".
Dictionary fallbackStorebag();

}  // namespace vesk
