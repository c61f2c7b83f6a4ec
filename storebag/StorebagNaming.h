// Which storebag a client type uses, and which section of it applies to an environment.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "protocol/StorebagName.h"

namespace vesk {

/// The name of an environment type's section; nullopt for types other than 1 to 4.
std::optional<std::string_view> environmentNameForType(std::int32_t environmentType);

}  // namespace vesk
