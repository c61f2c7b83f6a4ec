// The service manager that started the process, if one did.
#pragma once

#include <chrono>
#include <optional>
#include <utility>

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// Speaks the service manager's protocol: inherited sockets, readiness, watchdog. Without a manager
/// every notification does nothing. Construct it before the process has other threads; the notifications are
/// thread-safe.
class ServiceManager {
 public:
  /// Takes over what the environment names, and removes it from the environment. An inherited descriptor that
  /// is no listening Unix stream socket, or a second socket, is closed and costs one level-4 line.
  ServiceManager();

  /// True when the manager passed a socket: it listens for us while we don't run, so we may exit when idle.
  bool isSocketActivated() const noexcept { return _socketActivated; }
  /// The inherited listening socket; none when there is none or it has been taken.
  FileDescriptor takeListeningSocket() noexcept { return std::move(_socket); }

  void notifyReady() const noexcept;
  void notifyStopping() const noexcept;

  /// How often the manager wants to hear from us; nothing when it does not watch.
  std::optional<std::chrono::milliseconds> watchdogInterval() const noexcept { return _watchdogInterval; }
  void pingWatchdog() const noexcept;

 private:
  FileDescriptor _socket;
  bool _socketActivated = false;
  std::optional<std::chrono::milliseconds> _watchdogInterval;
};

}  // namespace vesk
