// Tells when the machine's routes change, as they do when a network comes up.
#pragma once

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// A subscription to the kernel's route events. For use by one thread. Never blocks.
class NetworkMonitor {
 public:
  NetworkMonitor();

  /// Readable after an event; -1 if the kernel doesn't offer route events.
  int fd() const noexcept { return _socket.get(); }
  /// Takes all events. Returns true if a route was added, or if events were lost.
  bool takeChange() noexcept;

 private:
  FileDescriptor _socket;
};

}  // namespace vesk
