// Memory that runs out on one thread. Include it in the one source file of a test program that replaces
// operator new.
#pragma once

#include <sys/prctl.h>

#include <atomic>
#include <cstdlib>
#include <cstring>
#include <new>

namespace vesk::test {

/// While it lives, the `n`th allocation on a thread fails, and those after it too when it is lasting.
class ScarceMemory {
 public:
  /// On the calling thread, or on that of this name.
  explicit ScarceMemory(long n, bool lasting = false, const char* thread = nullptr) {
    _left = n;
    _isLasting = lasting;
    _isHere = !thread;
    _victim = thread;
  }
  ~ScarceMemory() {
    _isHere = false;
    _victim = nullptr;
  }
  ScarceMemory(const ScarceMemory&) = delete;
  ScarceMemory& operator=(const ScarceMemory&) = delete;

  static bool hasRunOut() { return _left <= 0; }

  static bool runsOut() {
    if (!_isHere && !isVictim()) return false;
    const long left = --_left;
    return left == 0 || (left < 0 && _isLasting);
  }

 private:
  static bool isVictim() {
    const char* victim = _victim;
    char name[16] = "";
    return victim && ::prctl(PR_GET_NAME, name) == 0 && std::strcmp(name, victim) == 0;
  }

  static inline thread_local bool _isHere = false;
  static inline std::atomic<const char*> _victim{nullptr};  ///< its name
  static inline std::atomic<long> _left{1};
  static inline std::atomic<bool> _isLasting{false};
};

}  // namespace vesk::test

void* operator new(std::size_t size) {
  void* memory = vesk::test::ScarceMemory::runsOut() ? nullptr : std::malloc(size > 0 ? size : 1);
  if (!memory) throw std::bad_alloc();
  return memory;
}
void operator delete(void* memory) noexcept { std::free(memory); }
void operator delete(void* memory, std::size_t) noexcept { std::free(memory); }
