// What the daemon has to be told again after a reconnection.
#pragma once

#include <memory>
#include <vector>

#include "client/ClientCall.h"

namespace vesk {

/// Configuration and start of the session as they were last sent. For one thread.
class SessionMemory {
 public:
  /// `call` was sent.
  void note(const ClientCall& call);

  /// Nothing was ever sent that the daemon would have to know again.
  bool isEmpty() const noexcept { return !_isConfigured && !_isStarted; }

  /// The calls that bring a new session of the daemon to where this one was.
  std::vector<IPCOutgoingCall> replay() const;

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
