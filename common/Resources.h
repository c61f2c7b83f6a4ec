// Resource files of the installed client library, in /usr/share/veskreporting.
#pragma once

#include <optional>
#include <string>
#include <vector>

namespace vesk {

/// The first line of the file "version", or "7.0" if there is no usable one.
std::string clientLibraryVersion() noexcept;

/// The RSA public key that storebags are verified with, from the file "publicKey.der"; nullopt if the file is
/// missing, empty, unreadable or not trusted.
std::optional<std::string> publicKeyDER() noexcept;

/// That key, and those of the files "publicKeys/*.der" by their names, at most 16 in all: while keys are
/// being replaced, storebags may be signed with either.
std::vector<std::string> publicKeysDER();

}  // namespace vesk
