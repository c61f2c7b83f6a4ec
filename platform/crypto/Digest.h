// Message digests.
#pragma once

#include <array>
#include <string_view>

namespace vesk {

using SHA1Digest = std::array<unsigned char, 20>;
using SHA256Digest = std::array<unsigned char, 32>;

/// The digest of `bytes`. Thread-safe; each thread reuses one digest context. Throws std::runtime_error if
/// the library is out of memory or lacks the digest.
SHA1Digest sha1(std::string_view bytes);
SHA256Digest sha256(std::string_view bytes);

}  // namespace vesk
