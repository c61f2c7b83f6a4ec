// The built-in storebag.
#pragma once

#include <VeskReporting/values/Value.h>

namespace vesk {

/// The payload used for the storebag "palvo" if its server can't be reached. Unsigned; has no section "seed".
Dictionary fallbackStorebag();

}  // namespace vesk
