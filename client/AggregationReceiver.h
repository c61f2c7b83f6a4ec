// The client's own object on the wire.
#pragma once

#include "client/protocol/ClientSessionInterface.h"
#include "platform/ipc/IPCConnection.h"

namespace vesk {

/// Decodes the daemon's calls for the client's side of the protocol.
class AggregationReceiver final : public IPCExportedObject {
 public:
  /// `client` outlives this object and must not throw.
  explicit AggregationReceiver(ClientSessionReplyInterface& client) noexcept : _client(client) {}

  const char* interfaceName() const override;
  void handle(IPCIncomingCall& call) override;

 private:
  ClientSessionReplyInterface& _client;
};

}  // namespace vesk
