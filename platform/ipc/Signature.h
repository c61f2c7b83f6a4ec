// D-Bus type signatures. Private to platform/ipc.
#pragma once

#include <cstddef>
#include <iterator>
#include <string_view>
#include <type_traits>
#include <variant>

#include "platform/ipc/IPCConnection.h"

namespace vesk {

/// Of arguments, in the order of IPCArgument's alternatives.
inline constexpr std::string_view kArgumentTypes[] = {"b",      "q",  "d",  "s",   "a{sv}", "av",
                                                      "aa{sv}", "as", "as", "aas", "ah"};
static_assert(std::size(kArgumentTypes) == std::variant_size_v<IPCArgument>);

template <class T, std::size_t At = 0>
constexpr std::string_view argumentType() noexcept {
  if constexpr (std::is_same_v<T, std::variant_alternative_t<At, IPCArgument>>) {
    return kArgumentTypes[At];
  } else {
    return argumentType<T, At + 1>();
  }
}

/// Of a value without others inside.
constexpr bool isBasicType(char type) noexcept {
  constexpr std::string_view kBasicTypes = "ybnqiuxtdsogh";
  for (const char basic : kBasicTypes) {
    if (type == basic) return true;
  }
  return false;
}

/// Length of the complete type that `signature` begins with; 0 when it begins with none, or with one that is
/// nested deeper than D-Bus allows (32 arrays, 32 structures).
std::size_t completeTypeLength(std::string_view signature) noexcept;

/// Any number of complete types, at most 255 characters.
bool isValidSignature(std::string_view signature) noexcept;

/// In bytes: where a value of a type that begins with `type` may stand. 1 for what is no type.
std::size_t alignmentOf(char type) noexcept;

}  // namespace vesk
