// A root prefix for the test program, set before anything reads a file below it.
#pragma once

#include "platform/files/RootPrefix.h"
#include "tests/support/TempDirectory.h"

namespace vesk::test {

/// Include in only one source file of a test program. The root is initially empty.
inline const TempDirectory& testRoot() {
  static const TempDirectory directory;
  return directory;
}

inline const bool kTestRootIsSet = [] {
  setRootPrefix(testRoot().path().string());
  return true;
}();

}  // namespace vesk::test
