// The service manager that started the process, if any.
#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <utility>

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// Implements the service manager's protocol: inherited sockets, readiness, watchdog. Without a manager,
/// notifications do nothing. Construct it before the process has other threads; notifications are
/// thread-safe.
class ServiceManager {
 public:
  /// Takes over inherited sockets and removes their variables from the environment. Closes a descriptor that
  /// is not a listening Unix stream socket, and any second socket, with one level-4 line each.
  ServiceManager();

  /// True if the manager passed a socket. The manager then listens while we don't run, so we may exit when
  /// idle.
  bool isSocketActivated() const noexcept { return _socketActivated; }
  /// The inherited listening socket; empty if there was none or it has been taken.
  FileDescriptor takeListeningSocket() noexcept { return std::move(_socket); }

  /// Whether there is one.
  static bool isPresent() noexcept;

  void notifyReady() const noexcept;
  /// Sets the status line that the manager shows for the service.
  void notifyStatus(const std::string& line) const noexcept;
  void notifyStopping() const noexcept;

  /// The interval between pings; nullopt without a watchdog.
  std::optional<std::chrono::milliseconds> watchdogInterval() const noexcept { return _watchdogInterval; }
  void pingWatchdog() const noexcept;

 private:
  FileDescriptor _socket;
  bool _socketActivated = false;
  std::optional<std::chrono::milliseconds> _watchdogInterval;
};

}  // namespace vesk
