#include "platform/service/ProcessMemory.h"

#include <link.h>
#include <malloc.h>
#include <sys/mman.h>
#include <unistd.h>

#include <bit>
#include <cstdint>
#include <cstdlib>
#include <new>

namespace vesk {

namespace {

constexpr int kKept = 512 * 1024;  // bytes kept at the top of a heap; larger blocks are mapped separately
constexpr int kMostArenas = 4;

/// Releases only read-only pages, which can be reloaded unchanged from their file.
int releaseObject(dl_phdr_info* object, std::size_t, void*) {
  const auto page = static_cast<std::uintptr_t>(::sysconf(_SC_PAGESIZE));
  for (int i = 0; i < object->dlpi_phnum; ++i) {
    const auto& segment = object->dlpi_phdr[i];
    if (segment.p_type != PT_LOAD || (segment.p_flags & PF_W) != 0) continue;
    const std::uintptr_t start = object->dlpi_addr + segment.p_vaddr;
    const std::uintptr_t begin = start / page * page;
    ::madvise(std::bit_cast<void*>(begin), start + segment.p_memsz - begin, MADV_DONTNEED);
  }
  return 0;
}

// Neither allocates nor takes a lock, so it bypasses the log. The journal understands the level.
[[noreturn]] void endNow() {
  constexpr char kLine[] = "<3>main: Out of memory, ending\n";
  [[maybe_unused]] const auto written = ::write(STDERR_FILENO, kLine, sizeof kLine - 1);
  std::_Exit(EXIT_FAILURE);
}

}  // namespace

void setUpAllocator() noexcept {
  ::mallopt(M_TRIM_THRESHOLD, kKept);
  ::mallopt(M_MMAP_THRESHOLD, kKept);
  ::mallopt(M_ARENA_MAX, kMostArenas);
}

void endWhenOutOfMemory() noexcept { std::set_new_handler(endNow); }

void releaseFreePages() noexcept { ::malloc_trim(0); }

void releaseStartUpPages() noexcept { ::dl_iterate_phdr(&releaseObject, nullptr); }

}  // namespace vesk
