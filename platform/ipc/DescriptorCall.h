// Calls that bring descriptors. Private to platform/ipc.
#pragma once

#include <cstddef>
#include <string_view>

namespace vesk {

/// A longer call with descriptors is refused: a file's URL has 12 KiB at most.
inline constexpr std::size_t kMaximumDescriptorCall = 16 * 1024;

/// Whether `message`, one whole message, is a call of the object at `objectPath` that declares exactly
/// `descriptors` of them and takes some.
///
/// sd-bus forgets the descriptors of a message that it drops as broken, so it gets none unless this has found
/// nothing wrong with the header. It is stricter than sd-bus, whose own judgement of names it uses.
bool isDescriptorCall(std::string_view message, std::string_view objectPath, std::size_t descriptors);

}  // namespace vesk
