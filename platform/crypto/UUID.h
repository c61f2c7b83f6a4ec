// Random identifiers.
#pragma once

#include <array>
#include <string>

namespace vesk {

/// The bytes of a UUID, in the order of its text.
using UUIDBytes = std::array<unsigned char, 16>;

/// A fresh random UUID (version 4). Safe from any thread and after a fork. Throws std::system_error when the
/// system has no random bytes.
UUIDBytes makeUUID();

/// The usual text, lower case: 8-4-4-4-12 hexadecimal digits.
std::string uuidText(const UUIDBytes& uuid);

}  // namespace vesk
