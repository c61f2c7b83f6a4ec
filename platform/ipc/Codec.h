// Limits on the arguments of one message, and the errors of reading or writing them.
#pragma once

#include <cstddef>

namespace vesk {

/// Counted over all arguments of a message while they are read or written, before memory is allocated for
/// anything beyond the limits.
struct CodecLimits {
  std::size_t depth = 64;                      ///< nesting of lists and dictionaries
  std::size_t nodes = 100'000;                 ///< values, including each list and dictionary
  std::size_t content = std::size_t{1} << 20;  ///< bytes of texts and byte strings, plus 8 for each node
};

/// Bytes that each value adds to `CodecLimits::content`, besides its text or bytes.
inline constexpr std::size_t kNodeContent = 8;

/// Maximum nesting of arrays, structures, dictionary entries and variants; D-Bus libraries refuse more. A
/// dictionary in a dictionary takes three of them: array, entry, variant.
inline constexpr std::size_t kMaximumContainers = 127;

enum class CodecResult {
  Ok,
  WrongType,      ///< the arguments are not of the requested types, or have a type that no value has
  LimitExceeded,  ///< too deeply nested, too many values or too large
  Malformed       ///< bytes that violate the format, or text that is not UTF-8 or contains a NUL
};

/// A readable description; a constant.
const char* describe(CodecResult result) noexcept;

}  // namespace vesk
