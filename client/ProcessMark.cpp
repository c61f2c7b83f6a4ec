#include "client/ProcessMark.h"

#include <sys/mman.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <new>

namespace vesk {

namespace {

using Word = std::atomic<std::uint64_t>;

// Process IDs come round again, so the time goes in as well.
std::uint64_t makeMark() noexcept {
  auto now = std::chrono::steady_clock::now().time_since_epoch().count();
  return (static_cast<std::uint64_t>(::getpid()) << 32) | (static_cast<std::uint32_t>(now) | 1U);
}

Word* mapWord() noexcept {
  auto size = static_cast<std::size_t>(::sysconf(_SC_PAGESIZE));
  void* page = ::mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (page == MAP_FAILED) return nullptr;
  if (::madvise(page, size, MADV_WIPEONFORK) != 0) {
    ::munmap(page, size);
    return nullptr;
  }
  return new (page) Word(0);
}

// No function-local static: a fork while another thread makes it would leave the child waiting for ever.
Word* word() noexcept {
  static constinit std::atomic<Word*> shared{nullptr};
  Word* known = shared.load(std::memory_order_acquire);
  if (known) return known;
  Word* mine = mapWord();
  if (mine && !shared.compare_exchange_strong(known, mine)) {
    ::munmap(mine, static_cast<std::size_t>(::sysconf(_SC_PAGESIZE)));
    return known;
  }
  return mine;
}

}  // namespace

std::uint64_t processMark() noexcept {
  Word* mark = word();
  if (!mark) return static_cast<std::uint64_t>(::getpid());
  std::uint64_t value = mark->load(std::memory_order_relaxed);
  if (value != 0) return value;
  std::uint64_t fresh = makeMark();
  return mark->compare_exchange_strong(value, fresh) ? fresh : value;
}

}  // namespace vesk
