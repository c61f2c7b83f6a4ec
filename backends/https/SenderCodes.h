// The short codes by which servers know the client types.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string_view>

namespace vesk {

/// The sender code of a client type. Returns nullopt outside 0 to 11; header and event field are then
/// omitted.
inline std::optional<std::string_view> senderCodeForClientType(std::int32_t clientType) noexcept {
  constexpr std::array<std::string_view, 12> kCodes{"QX", "WB", "JYP", "KF", "UZ", "HD",
                                                    "EP", "YW", "BQ",  "FX", "DJ", "OZ"};
  if (clientType < 0 || clientType >= static_cast<std::int32_t>(kCodes.size())) return std::nullopt;
  return kCodes[static_cast<std::size_t>(clientType)];
}

}  // namespace vesk
