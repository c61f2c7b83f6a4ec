// Message digests.
#pragma once

#include <array>
#include <string_view>

namespace vesk {

using SHA1Digest = std::array<unsigned char, 20>;
using SHA256Digest = std::array<unsigned char, 32>;

/// The digest of all of `bytes`. Safe from any thread; a thread keeps one digest context for all its calls.
/// Throws std::runtime_error only when the library has no memory or no such digest.
SHA1Digest sha1(std::string_view bytes);
SHA256Digest sha256(std::string_view bytes);

}  // namespace vesk
