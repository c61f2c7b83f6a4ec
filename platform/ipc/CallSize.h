// What a call costs while it waits and when it is sent.
#pragma once

#include <cstddef>

#include "platform/ipc/IPCConnection.h"

namespace vesk {

/// Memory that a call holds, its own size included, roughly, in bytes.
std::size_t approximateMemory(const IPCOutgoingCall& call) noexcept;

/// What a call comes to as `CodecLimits::content` counts it, roughly; not less.
std::size_t approximateContent(const IPCOutgoingCall& call) noexcept;

}  // namespace vesk
