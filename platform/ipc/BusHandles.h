// Owners of sd-bus objects. Private to platform/ipc.
#pragma once

#include <systemd/sd-bus.h>

#include <memory>

namespace vesk {

struct BusCloser {
  void operator()(sd_bus* bus) const noexcept { sd_bus_close_unref(bus); }
};
using BusHandle = std::unique_ptr<sd_bus, BusCloser>;

struct BusMessageReleaser {
  void operator()(sd_bus_message* message) const noexcept { sd_bus_message_unref(message); }
};
using BusMessageHandle = std::unique_ptr<sd_bus_message, BusMessageReleaser>;

}  // namespace vesk
