// The daemon's view of the client's object.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "platform/ipc/IPCConnection.h"

namespace vesk {

/// Sends each call through the connection's outbox. Never blocks; for any thread.
class ClientSessionReplyProxy {
 public:
  /// `errorHandler` is called, on the calling thread, when a call can't be sent.
  ClientSessionReplyProxy(std::shared_ptr<IPCConnection> connection,
                          std::function<void(const std::string& error)> errorHandler)
      : _connection(std::move(connection)), _errorHandler(std::move(errorHandler)) {}

  /// A message that the client aggregates. `timestamp`: seconds since 1970. The closing message of an
  /// aggregation has no session info, time 0, category 0, type 0 and no payload.
  void sendMessageToClient(const std::optional<Dictionary>& sessionInfo, double timestamp,
                           std::uint16_t category, std::uint16_t type,
                           const std::optional<Dictionary>& payload);

 private:
  const std::shared_ptr<IPCConnection> _connection;
  const std::function<void(const std::string& error)> _errorHandler;
};

}  // namespace vesk
