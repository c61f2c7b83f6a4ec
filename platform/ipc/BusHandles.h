// Owners of sd-bus objects, and what both ends of a connection make of them. Private to platform/ipc.
#pragma once

#include <systemd/sd-bus.h>

#include <memory>
#include <string>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/IPCConnection.h"

namespace vesk {

struct BusCloser {
  void operator()(sd_bus* bus) const noexcept { sd_bus_close_unref(bus); }
};
using BusHandle = std::unique_ptr<sd_bus, BusCloser>;

struct BusMessageReleaser {
  void operator()(sd_bus_message* message) const noexcept { sd_bus_message_unref(message); }
};
using BusMessageHandle = std::unique_ptr<sd_bus_message, BusMessageReleaser>;

/// Throws std::system_error when `result`, of the function called `what`, is an error.
void checkBus(int result, const char* what);

/// A bus on `socket` that passes descriptors and has yet to be started. Throws std::system_error.
BusHandle newBus(FileDescriptor socket);

/// A message for `call` that lacks its arguments; none when the bus has ended.
BusMessageHandle newCall(sd_bus* bus, const std::string& objectPath, const IPCOutgoingCall& call,
                         bool expectReply);

}  // namespace vesk
