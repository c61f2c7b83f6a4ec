// The text of a dashboard datagram.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// Text unchanged, numbers as decimal text, "null" for any other value or none.
std::string descriptionForObject(const std::optional<Value>& object);

/// Removes newlines, doubles each backslash and escapes each "=" with a backslash. Returns "empty" if nothing
/// is left.
std::string sanitize(std::string_view text);

/// Writes " key=value" for each entry into `area` of `size` bytes and returns the length. Shorter values come
/// first, by UTF-16 code units before sanitising. Never uses the last byte of the area; cuts off what does
/// not fit. Writes keys unchanged.
std::size_t writePayloadText(const Dictionary& payload, char* area, std::size_t size);

}  // namespace vesk
