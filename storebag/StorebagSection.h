// The section of a storebag that applies to an environment.
#pragma once

#include <cstdint>
#include <optional>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// The section of a storebag's payload for an environment type. The section "release" replaces a missing
/// section "seed". Returns nullopt, with a line of level 3, if there is no section; the line shows "(none)"
/// for an environment type without a name.
std::optional<Dictionary> storebagSectionForEnvironment(const Dictionary& payload,
                                                        std::int32_t environmentType,
                                                        std::int32_t clientType);

}  // namespace vesk
