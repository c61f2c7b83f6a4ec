// Detects that the process was forked.
#pragma once

#include <sys/mman.h>
#include <unistd.h>

namespace vesk {

/// Belongs to the process that created it. The kernel clears the mark in a child (MADV_WIPEONFORK), so this
/// needs no hook in the host process, also detects forks that bypass the C library, and costs one load from
/// memory. If the kernel can't do that, each check asks for the process ID. Thread-safe.
class ForkGuard {
 public:
  ForkGuard() noexcept {
    void* page = ::mmap(nullptr, kSize, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    if (page == MAP_FAILED) return;
    if (::madvise(page, kSize, MADV_WIPEONFORK) == 0) _mark = static_cast<volatile char*>(page);
    if (_mark) {
      *_mark = 1;
    } else {
      ::munmap(page, kSize);
    }
  }
  ~ForkGuard() {
    if (_mark) ::munmap(const_cast<char*>(_mark), kSize);
  }
  ForkGuard(const ForkGuard&) = delete;
  ForkGuard& operator=(const ForkGuard&) = delete;

  /// Returns false in a process forked from the one that created this.
  bool isOurs() const noexcept { return _mark ? *_mark != 0 : ::getpid() == _process; }

 private:
  static constexpr std::size_t kSize = 1;  // the kernel uses a whole page

  const pid_t _process = ::getpid();
  volatile char* _mark = nullptr;
};

}  // namespace vesk
