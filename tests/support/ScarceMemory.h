// Simulates out-of-memory on one thread. Replaces operator new, so include it in only one source file of a
// test program.
#pragma once

#include <cstdlib>
#include <new>
#include <utility>

namespace vesk::test {

/// Makes the thread's next allocation fail. Does nothing in sanitized builds, which replace operator new.
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
void* operator new(std::size_t size) {
  void* memory = vesk::test::ScarceMemory::runsOut() ? nullptr : std::malloc(size > 0 ? size : 1);
  if (!memory) throw std::bad_alloc();
  return memory;
}
void operator delete(void* memory) noexcept { std::free(memory); }
void operator delete(void* memory, std::size_t) noexcept { std::free(memory); }
#endif
