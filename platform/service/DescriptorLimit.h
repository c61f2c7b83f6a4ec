// The limit on the process's descriptors.
#pragma once

#include <cstddef>

namespace vesk {

/// Raises the soft limit to the hard limit. The default is low for programs that use select(), which we
/// don't, and each connection needs several descriptors. Call before threads start.
void raiseDescriptorLimit() noexcept;

/// The soft limit; 0 if unknown.
std::size_t descriptorLimit() noexcept;

}  // namespace vesk
