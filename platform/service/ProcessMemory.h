// Controls the memory of the process.
#pragma once

namespace vesk {

/// Makes the allocator keep memory that a busy thread needs again soon: it frees a batch's buffers a thousand
/// times a second, and would otherwise return their pages to the kernel each time. Uses few arenas, so that
/// threads don't each keep free memory. Call before anything else.
void setUpAllocator() noexcept;

/// From now on, an allocation with `new` that fails ends the process with status 1, after one line of level 3
/// on standard error. The process's memory is bounded, so it is the system that has run out: its service
/// manager starts it again. Nothing is unwound.
void endWhenOutOfMemory() noexcept;

/// Releases pages of programs and libraries that were only used during start-up, mostly for relocation. A
/// page that is needed again is in the page cache. Call once the process has started. Thread-safe.
void releaseStartUpPages() noexcept;

/// Returns the pages of freed memory to the kernel, including those between used ones. After a busy time this
/// takes some milliseconds, during which threads that allocate may have to wait. Thread-safe.
void releaseFreePages() noexcept;

}  // namespace vesk
