// What the installed client library carries besides code: files under /usr/share/veskreporting.
#pragma once

#include <optional>
#include <string>

namespace vesk {

/// The version that the installation declares (the first line of the file "version", trimmed). Nothing when
/// there is no such file or it holds nothing usable.
std::optional<std::string> bundleVersion();

/// `bundleVersion`, or "7.0" when none is declared.
std::string clientLibraryVersion();

/// The bytes of "publicKey.der"; nothing when the file is missing, empty or larger than 64 KiB.
std::optional<std::string> publicKeyDER();

}  // namespace vesk
