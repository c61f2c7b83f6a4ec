// Random identifiers.
#pragma once

#include <array>
#include <string>

namespace vesk {

/// The bytes of a UUID, in the order of its text.
using UUIDBytes = std::array<unsigned char, 16>;

/// Creates a random UUID (version 4). Thread-safe; safe after a fork. Throws std::system_error if the system
/// has no random bytes.
UUIDBytes makeUUID();

/// The usual lower-case form: 8-4-4-4-12 hexadecimal digits.
std::string uuidText(const UUIDBytes& uuid);

}  // namespace vesk
