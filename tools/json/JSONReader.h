// A JSON reader for the tools.
#pragma once

#include <cstddef>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "platform/result/Result.h"

namespace vesk {

/// Reads a single JSON value with optional white space around it. Arrays and objects may nest `depth` deep.
/// Integers become signed if they fit; null becomes the null marker. Objects keep their order, and the last
/// value of a repeated key wins. Doesn't throw for any `text`. Errors have line and column.
Result<Value> parseJSON(std::string_view text, std::size_t depth = 32);

}  // namespace vesk
