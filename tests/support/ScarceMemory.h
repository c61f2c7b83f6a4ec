// Simulates out-of-memory on one thread. Replaces malloc, so include it in only one source file of a
// test program.
#pragma once

#include <cstddef>
#include <utility>

namespace vesk::test {

/// Makes the thread's next allocation fail. Does nothing in sanitized builds, which replace malloc.
class ScarceMemory {
 public:
  ScarceMemory() { _isScarce = true; }
  ~ScarceMemory() { _isScarce = false; }
  ScarceMemory(const ScarceMemory&) = delete;
  ScarceMemory& operator=(const ScarceMemory&) = delete;

  static bool runsOut() { return std::exchange(_isScarce, false); }

 private:
  static inline thread_local bool _isScarce = false;
};

}  // namespace vesk::test

#if !defined(__SANITIZE_THREAD__) && !defined(__SANITIZE_ADDRESS__)
extern "C" void* __libc_malloc(std::size_t size);
extern "C" void* malloc(std::size_t size) noexcept {
  return vesk::test::ScarceMemory::runsOut() ? nullptr : __libc_malloc(size);
}
#endif
