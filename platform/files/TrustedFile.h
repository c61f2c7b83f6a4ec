// Reads files that decide what the process trusts.
#pragma once

#include <cstddef>
#include <string>

#include "platform/files/SmallFile.h"

namespace vesk {

/// Who, besides root, may own a file that is trusted.
enum class TrustedOwner : unsigned char {
  Root,     ///< no other user; under a root prefix, the process's own user
  OwnUser,  ///< the process's own user
};

/// As `readSmallFile`, but refuses a file that has another owner, or that its group or others may write to. A
/// refusal is logged once in the life of the process, in a level-4 line with path and reason; its outcome is
/// marked as `reported`.
SmallFile readTrustedFile(const std::string& path, std::size_t limit,
                          TrustedOwner owner = TrustedOwner::Root);

}  // namespace vesk
