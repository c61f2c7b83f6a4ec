// The text of a dashboard datagram.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// A text as it is, a number as decimal text, "null" for anything else and for none.
std::string descriptionForObject(const std::optional<Value>& object);

/// Without newlines, with each backslash doubled and each "=" behind a backslash of its own; "empty" for what
/// is empty then.
std::string sanitize(std::string_view text);

/// Writes " key=value" for each entry, shortest value first (in UTF-16 code units, before sanitising), into
/// `area` of `size` bytes and gives the length. The last byte of the area is never used; what does not fit is
/// cut off. Keys are written as they are.
std::size_t writePayloadText(const Dictionary& payload, char* area, std::size_t size);

}  // namespace vesk
