// What the daemon has to be told again after a reconnection.
#pragma once

#include <array>
#include <memory>

#include "client/ClientCall.h"

namespace vesk {

/// Configuration and start of the session as they were last sent. For one thread.
class SessionMemory {
 public:
  /// `call` is on its way to the daemon.
  void sending(const ClientCall& call) noexcept {
    if (call.effect == CallEffect::Configures) _aggregation = call.aggregation;
  }
  /// `call` was sent whole; what it says is kept. Needs no memory: a call that was sent can't be taken back.
  void sent(IPCOutgoingCall&& call, CallEffect effect) noexcept;

  /// Nothing was ever sent that the daemon would have to know again.
  bool isEmpty() const noexcept { return !_isConfigured && !_isStarted; }

  /// The calls that bring a new session of the daemon to where this one was; null for those not made.
  std::array<const IPCOutgoingCall*, 2> replay() const noexcept;

  /// Null when the client does not aggregate.
  const std::shared_ptr<const AggregationHandler>& aggregation() const noexcept { return _aggregation; }

 private:
  IPCOutgoingCall _configuration{nullptr, nullptr, {}};
  IPCOutgoingCall _start{nullptr, nullptr, {}};
  bool _isConfigured = false;
  bool _isStarted = false;
  std::shared_ptr<const AggregationHandler> _aggregation;
};

}  // namespace vesk
