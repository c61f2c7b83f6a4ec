// System calls on sockets that fail as a test wants; SocketFaults.cpp puts itself before the C library.
#pragma once

#include <cerrno>
#include <deque>

namespace vesk::test {

/// What happens to the calling thread's next calls.
struct SocketFaults {
  static constexpr int kShort = -1;
  /// One for each call of `send`: 0 lets it through, kShort sends too little, others are errors.
  static inline thread_local std::deque<int> sends;
  static inline thread_local int bindError = 0;
  static inline thread_local int socketError = 0;

  static int fail(int error) {
    errno = error;
    return -1;
  }
};

}  // namespace vesk::test
