// D-Bus type signatures. Private to platform/ipc.
#pragma once

#include <cstddef>
#include <iterator>
#include <string_view>
#include <type_traits>
#include <variant>

#include "platform/ipc/IPCConnection.h"

namespace vesk {

/// The D-Bus types of arguments, in the order of IPCArgument's alternatives.
inline constexpr std::string_view kArgumentTypes[] = {"b",  "q",  "d",   "s",  "a{sv}", "av",    "aa{sv}",
                                                      "as", "as", "aas", "ah", "a{sv}", "aa{sv}"};
static_assert(std::size(kArgumentTypes) == std::variant_size_v<IPCArgument>);

template <class T, std::size_t At = 0>
constexpr std::string_view argumentType() noexcept {
  if constexpr (std::is_same_v<T, std::variant_alternative_t<At, IPCArgument>>) {
    return kArgumentTypes[At];
  } else {
    return argumentType<T, At + 1>();
  }
}

/// Whether values of the type contain no other values.
constexpr bool isBasicType(char type) noexcept {
  constexpr std::string_view kBasicTypes = "ybnqiuxtdsogh";
  for (const char basic : kBasicTypes) {
    if (type == basic) return true;
  }
  return false;
}

/// The length of the first complete type of `signature`. Returns 0 if there is none, or if it is nested
/// deeper than D-Bus allows (32 arrays, 32 structures).
std::size_t completeTypeLength(std::string_view signature) noexcept;

/// Accepts any number of complete types, at most 255 characters.
bool isValidSignature(std::string_view signature) noexcept;

/// The alignment in bytes of a value whose type begins with `type`; 1 for an unknown type.
std::size_t alignmentOf(char type) noexcept;

}  // namespace vesk
