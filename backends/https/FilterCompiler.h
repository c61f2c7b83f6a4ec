// Filters as a storebag writes them, made into records.
#pragma once

#include <string_view>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "backends/https/EventFilters.h"

namespace vesk {

/// One record per element, in order. A filter that hides a value never fails open: with a `method` or
/// `status` that can't be read it applies to any, while one that only leaves values alone then applies to
/// nothing. Each mistake costs one line of level 4 that names backend, filter (from 0) and field; further
/// updates and sessions with the same filters don't repeat them. Thread-safe.
std::vector<filterTag> compileFilters(const List& filters, std::string_view backendName);

}  // namespace vesk
