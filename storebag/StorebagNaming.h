// Which storebag a client type uses, and which section of it applies to an environment.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// Returns nullopt for a client type without a storebag. Types 7 and 11 share one.
std::optional<std::string_view> storebagNameForClientType(std::int32_t clientType);

/// The name of an environment type's section; nullopt for types other than 1 to 4.
std::optional<std::string_view> environmentNameForType(std::int32_t environmentType);

}  // namespace vesk
