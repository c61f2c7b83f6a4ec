// The daemon's proxy for the object that the client exports.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/ipc/IPCConnection.h"

namespace vesk {

/// Queues calls to the client on its connection. Never blocks. Thread-safe.
class ClientSessionReplyProxy {
 public:
  /// `errorHandler` runs on the calling thread if a call can't be sent.
  ClientSessionReplyProxy(std::shared_ptr<IPCConnection> connection,
                          std::function<void(const std::string& error)> errorHandler)
      : _connection(std::move(connection)), _errorHandler(std::move(errorHandler)) {}

  /// Sends a message for the client to aggregate. `timestamp` is in seconds since 1970. The message that
  /// closes an aggregation has no session info, time 0, category 0, type 0 and no payload.
  void sendMessageToClient(const std::optional<Dictionary>& sessionInfo, double timestamp,
                           std::uint16_t category, std::uint16_t type,
                           const std::optional<Dictionary>& payload);

 private:
  const std::shared_ptr<IPCConnection> _connection;
  const std::function<void(const std::string& error)> _errorHandler;
};

}  // namespace vesk
