// How many descriptors the process may have.
#pragma once

#include <cstddef>

namespace vesk {

/// Takes all that the hard limit grants: the soft one is low by default for the sake of programs that use
/// select(), which we don't, and each connection needs a few. To be called before threads start.
void raiseDescriptorLimit() noexcept;

/// The soft limit; 0 when the system doesn't tell.
std::size_t descriptorLimit() noexcept;

}  // namespace vesk
