// Unpacks gzip streams.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

#include "platform/result/Result.h"

namespace vesk {

/// Unpacks a single gzip member, which must span all of `compressed`, to at most `limit` bytes.
Result<std::string> gunzipped(std::string_view compressed, std::size_t limit);

}  // namespace vesk
