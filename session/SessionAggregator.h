// Sends messages to a client that aggregates them.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>

#include <VeskReporting/values/Value.h>
#include "platform/ipc/IPCConnection.h"
#include "platform/ipc/WarningBurst.h"
#include "platform/sync/Mutex.h"
#include "util/Counters.h"

namespace vesk {

/// Belongs to a session; other sessions of its family also use it. Thread-safe.
class SessionAggregator {
 public:
  SessionAggregator(std::shared_ptr<IPCConnection> connection, Counters& counters)
      : _connection(std::move(connection)), _counters(counters) {}

  /// Whether the client aggregates.
  bool isOn() const noexcept { return _hasAggregator.load(); }
  void setOn(bool isOn) noexcept { _hasAggregator.store(isOn); }
  /// Sends the client the closing message, once.
  void shutdown() VESK_EXCLUDES(_mutex);
  /// Stops counting losses: the session ends, and its client is usually gone.
  void end() noexcept { _isEnding.store(true); }

  /// Sends one message to the client without blocking. A message that the client does not take is dropped,
  /// counted, and logged once per burst, so that a client that does not read never delays the sender.
  void sendToAggregator(const std::optional<Dictionary>& sessionInfo, double timestamp,
                        std::uint16_t category, std::uint16_t type, const std::optional<Dictionary>& payload)
      VESK_EXCLUDES(_mutex);

 private:
  bool undeliveredBurstBegins();

  const std::shared_ptr<IPCConnection> _connection;
  Counters& _counters;
  std::atomic<bool> _hasAggregator{false};
  std::atomic<bool> _isEnding{false};

  Mutex _mutex;
  WarningBurst _undelivered VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
