// What a change of filters does to the fields of events.
#pragma once

#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// A clause for each field that leaves the device in another way, such as "'user' leaves in the clear now".
std::vector<std::string> fieldChanges(const List& before, const List& after);

}  // namespace vesk
