// The way of messages to a client that aggregates them.
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

/// Belongs to a session and is asked by its relatives too. Thread-safe.
class SessionAggregator {
 public:
  SessionAggregator(std::shared_ptr<IPCConnection> connection, Counters& counters)
      : _connection(std::move(connection)), _counters(counters) {}

  /// Whether the client aggregates.
  bool isOn() const noexcept { return _hasAggregator.load(); }
  void setOn(bool isOn) noexcept { _hasAggregator.store(isOn); }
  /// Tells the client, once, that no more messages come.
  void shutdown() VESK_EXCLUDES(_mutex);
  /// From now on losses aren't counted: the session ends, and a client that has gone misses nothing.
  void end() noexcept { _isEnding.store(true); }

  /// Hands one message to the client; never waits. One that the client doesn't take is lost and counted, with
  /// one line a burst: a sender must not pay for a client that doesn't read.
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
