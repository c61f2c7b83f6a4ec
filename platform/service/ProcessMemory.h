// How much memory the process claims.
#pragma once

namespace vesk {

/// Has the allocator keep what a busy thread needs again at once: such a thread frees a batch's buffers a
/// thousand times a second, and would give their pages back to the kernel and fetch them again each time. Few
/// arenas, so that many threads do not hoard some each. To be called first of all.
void setUpAllocator() noexcept;

/// Lets go of the pages of programs and libraries that only starting has touched, as relocating them does
/// with most of them; whoever needs one again finds it in the page cache. Once the process has started; safe
/// on any thread, at any time.
void releaseStartUpPages() noexcept;

/// Gives the pages of freed memory back to the kernel, those between used ones too. Takes some milliseconds
/// after a busy time, during which threads that allocate may have to wait; safe on any thread, at any time.
void releaseFreePages() noexcept;

}  // namespace vesk
