// Writes complete byte strings.
#pragma once

#include <string_view>

#include "platform/result/Result.h"

namespace vesk {

/// Writes all of `bytes`, in several pieces if necessary. Part of them may have been written if it fails.
Result<void> writeAll(int descriptor, std::string_view bytes);

}  // namespace vesk
