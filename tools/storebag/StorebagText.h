// A storebag's payload as text, for reading and editing.
#pragma once

#include <string>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// What is read back from either form is equal to the payload as far as the form can carry it: bytes become
/// their base64 text, and in JSON dates become numbers and what is not finite becomes a text. Throws
/// std::runtime_error when there is no such text.
std::string storebagAsJSON(const Dictionary& payload);
std::string storebagAsTOML(const Dictionary& payload);

}  // namespace vesk
