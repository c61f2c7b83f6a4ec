// A storebag's payload as text, for reading and editing.
#pragma once

#include <string>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// Reading the text back gives an equal payload as far as the format allows: bytes become base64 text; in
/// JSON, dates become numbers, and infinities and NaN become text. Throws std::runtime_error if the payload
/// can't be represented.
std::string storebagAsJSON(const Dictionary& payload);
std::string storebagAsTOML(const Dictionary& payload);

}  // namespace vesk
