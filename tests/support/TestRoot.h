// A root prefix of the test program's own, in place before anything reads a file below it.
#pragma once

#include "platform/files/RootPrefix.h"
#include "tests/support/TempDirectory.h"

namespace vesk::test {

/// Include it in the one source file of a test program that needs an empty root.
inline const TempDirectory& testRoot() {
  static const TempDirectory directory;
  return directory;
}

inline const bool kTestRootIsSet = [] {
  setRootPrefix(testRoot().path().string());
  return true;
}();

}  // namespace vesk::test
