// Makes system calls on sockets fail. SocketFaults.cpp overrides the C library's functions.
#pragma once

#include <cerrno>
#include <deque>

namespace vesk::test {

/// Faults for the calling thread's next calls.
struct SocketFaults {
  static constexpr int kShort = -1;
  /// One entry for each call of `send`: 0 succeeds, kShort sends too little, other values are errors.
  static inline thread_local std::deque<int> sends;
  static inline thread_local int bindError = 0;
  static inline thread_local int socketError = 0;

  static int fail(int error) {
    errno = error;
    return -1;
  }
};

}  // namespace vesk::test
