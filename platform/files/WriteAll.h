// Writes complete byte strings.
#pragma once

#include <string_view>

namespace vesk {

/// Writes all of `bytes`, in several pieces if necessary. Returns 0 or the error number; part of the bytes
/// may have been written then.
[[nodiscard]] int writeAll(int descriptor, std::string_view bytes) noexcept;

}  // namespace vesk
