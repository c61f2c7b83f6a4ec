// What a call costs while it waits and when it is sent.
#pragma once

#include <cstddef>

#include "platform/ipc/IPCConnection.h"

namespace vesk {

struct CodecLimits;

/// Memory that a call holds, its own size included, roughly, in bytes.
std::size_t approximateMemory(const IPCOutgoingCall& call) noexcept;

/// Whether a call holds more bytes or more values than `limits` lets a message have. Its bytes are counted
/// roughly, and not as fewer than they are.
bool isTooLarge(const IPCOutgoingCall& call, const CodecLimits& limits) noexcept;

}  // namespace vesk
