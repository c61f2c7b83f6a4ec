#include "platform/service/ServiceManager.h"

#include <sys/socket.h>
#include <systemd/sd-daemon.h>

#include <algorithm>
#include <cstdint>
#include <cstdlib>

#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

std::optional<std::chrono::milliseconds> askedInterval() {
  std::uint64_t microseconds = 0;
  if (sd_watchdog_enabled(1, &microseconds) <= 0) return std::nullopt;
  auto limit = std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::microseconds(microseconds));
  // Half of the manager's limit, as it recommends.
  return std::max(limit / 2, std::chrono::milliseconds(1));
}

}  // namespace

ServiceManager::ServiceManager() : _watchdogInterval(askedInterval()) {
  int count = sd_listen_fds(1);
  for (int i = 0; i < count; ++i) {
    FileDescriptor inherited(SD_LISTEN_FDS_START + i);
    if (!_socket && sd_is_socket_unix(inherited.get(), SOCK_STREAM, 1, nullptr, 0) > 0) {
      _socket = std::move(inherited);
    } else {
      VESK_LOG_WARNING("ServiceManager: Inherited descriptor %d is of no use, closing it", inherited.get());
    }
  }
  _socketActivated = static_cast<bool>(_socket);
}

void ServiceManager::notifyReady() const noexcept { sd_notify(0, "READY=1"); }

bool ServiceManager::isPresent() noexcept { return std::getenv("NOTIFY_SOCKET") != nullptr; }

void ServiceManager::notifyStatus(const std::string& line) const noexcept {
  sd_notify(0, ("STATUS=" + line).c_str());
}

void ServiceManager::notifyStopping() const noexcept { sd_notify(0, "STOPPING=1"); }

void ServiceManager::pingWatchdog() const noexcept { sd_notify(0, "WATCHDOG=1"); }

}  // namespace vesk
