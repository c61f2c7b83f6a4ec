// D-Bus type signatures. Private to platform/ipc.
#pragma once

#include <cstddef>
#include <string_view>

namespace vesk {

/// Length of the complete type that `signature` begins with; 0 when it begins with none, or with one that is
/// nested deeper than D-Bus allows (32 arrays, 32 structures).
std::size_t completeTypeLength(std::string_view signature) noexcept;

/// Any number of complete types, at most 255 characters.
bool isValidSignature(std::string_view signature) noexcept;

/// In bytes: where a value of a type that begins with `type` may stand. 1 for what is no type.
std::size_t alignmentOf(char type) noexcept;

}  // namespace vesk
