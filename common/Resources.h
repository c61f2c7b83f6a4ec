// Files that the installed client library carries besides code, in /usr/share/veskreporting.
#pragma once

#include <optional>
#include <string>

namespace vesk {

/// The first line of the file "version", or "7.0" without a usable one.
std::string clientLibraryVersion() noexcept;

/// The RSA public key that storebags are verified with: the file "publicKey.der"; nullopt when it is missing,
/// empty, unreadable or not trusted.
std::optional<std::string> publicKeyDER() noexcept;

}  // namespace vesk
