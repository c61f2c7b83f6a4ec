// Tells a process from the one that it was forked from.
#pragma once

#include <sys/mman.h>
#include <unistd.h>

namespace vesk {

/// Belongs to the process that made it. The kernel itself wipes the mark in a child (MADV_WIPEONFORK), so
/// this needs no hook in the host process, also notices forks that bypass the C library, and costs a load
/// from memory. Where the kernel can't, each question asks for the process ID. For any thread.
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

  /// False in a process forked from the one that made this.
  bool isOurs() const noexcept { return _mark ? *_mark != 0 : ::getpid() == _process; }

 private:
  static constexpr std::size_t kSize = 1;  // the kernel takes a whole page

  const pid_t _process = ::getpid();
  volatile char* _mark = nullptr;
};

}  // namespace vesk
