// Tells a process from the one that it was forked from.
#pragma once

#include <cstdint>

namespace vesk {

/// A number that is another one after a fork; costs a load from memory. The kernel itself wipes it in the
/// child (MADV_WIPEONFORK), so this needs no hook in the host process and also notices forks that bypass the
/// C library. Where the kernel can't, each call asks for the process ID. Thread-safe.
std::uint64_t processMark() noexcept;

}  // namespace vesk
