// What the arguments of one message may hold, and how reading or writing them can fail.
#pragma once

#include <cstddef>

namespace vesk {

/// Counted over all arguments of a message while they are read or written, before anything is allocated for
/// what would exceed it.
struct CodecLimits {
  std::size_t depth = 64;                      ///< lists and dictionaries inside one another
  std::size_t nodes = 100'000;                 ///< values, each list and dictionary included
  std::size_t content = std::size_t{1} << 20;  ///< bytes of texts and byte strings, plus 8 for each node
};

/// What a value counts for in `CodecLimits::content` besides its text or bytes.
inline constexpr std::size_t kNodeContent = 8;

/// Arrays, structures, dictionary entries and variants inside one another. D-Bus libraries refuse more, so a
/// dictionary in a dictionary takes three of them: array, entry, variant.
inline constexpr std::size_t kMaximumContainers = 127;

enum class CodecResult {
  Ok,
  WrongType,      ///< the arguments are not of the types asked for, or hold a type that no value has
  LimitExceeded,  ///< too deep, too many values or too large
  Malformed       ///< bytes that break the format, or text that is not UTF-8 or holds a NUL
};

/// For a person; a constant.
const char* describe(CodecResult result) noexcept;

}  // namespace vesk
