// Which storebag a client type uses.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

namespace vesk {

/// Returns nullopt for a client type without a storebag, which never gets a configuration. Types 7 and 11
/// share one.
constexpr std::optional<std::string_view> storebagNameForClientType(std::int32_t clientType) {
  switch (clientType) {
    case 5:
      return "zelko";
    case 6:
      return "brannic";
    case 7:
    case 11:
      return "palvo";
    case 8:
      return "tessin";
    case 9:
      return "quimby";
    case 10:
      return "dorvel";
    default:
      return std::nullopt;
  }
}

}  // namespace vesk
