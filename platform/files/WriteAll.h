// Writing whole texts.
#pragma once

#include <string_view>

namespace vesk {

/// Writes all of `bytes`, in as many pieces as the descriptor takes. 0 or the system's error number; a part
/// may have been written then.
[[nodiscard]] int writeAll(int descriptor, std::string_view bytes) noexcept;

}  // namespace vesk
