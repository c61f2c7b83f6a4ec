// Compiles a storebag's filters into records.
#pragma once

#include <string_view>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "backends/https/EventFilters.h"

namespace vesk {

/// Returns one record per element, in order. A filter that hides a value never fails open: if its `method` or
/// `status` can't be read, it applies to any, whereas a filter that only leaves values alone then applies to
/// nothing. Each mistake is logged in one line of level 4 that names the backend, the filter (from 0) and the
/// field; later updates and sessions with the same filters don't repeat it. Thread-safe.
std::vector<filterTag> compileFilters(const List& filters, std::string_view backendName);

}  // namespace vesk
