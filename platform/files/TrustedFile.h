// Reads files that determine what the process trusts.
#pragma once

#include <cstddef>
#include <string>

#include "platform/files/SmallFile.h"

namespace vesk {

/// Who may own a trusted file, besides root.
enum class TrustedOwner : unsigned char {
  Root,     ///< no other user; with a root prefix, also the process's own user
  OwnUser,  ///< the process's own user
};

/// Like `readSmallFile`, but refuses a file with another owner or that is writable by its group or others:
/// the error's kind is Untrusted. Logs each refusal once in the life of the process, in a level-4 line with
/// path and reason; a caller need not log it again.
Result<std::string> readTrustedFile(const std::string& path, std::size_t limit,
                                    TrustedOwner owner = TrustedOwner::Root);

}  // namespace vesk
