// Memory that runs out on one thread. Include it in the one source file of a test program that replaces
// operator new.
#pragma once

#include <cstdlib>
#include <new>
#include <utility>

namespace vesk::test {

/// The next allocation on the thread that makes it fails; not in sanitized builds, whose own operator new
/// has to stay.
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
