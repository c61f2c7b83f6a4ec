// The daemon's end of the protocol: turns incoming calls into calls of a session.
#pragma once

#include <memory>

#include "platform/ipc/IPCConnection.h"
#include "platform/ipc/IPCIncomingCall.h"
#include "protocol/ClientSessionInterface.h"

namespace vesk {

/// Exported under wire::kObjectPath. Owns its session, so the connection that exports it keeps the session
/// alive.
class ClientSessionStub final : public IPCExportedObject {
 public:
  explicit ClientSessionStub(std::shared_ptr<ClientSessionInterface> session)
      : _session(std::move(session)) {}

  const char* interfaceName() const override;
  const char* introspection() const override;
  void handle(IPCIncomingCall& call) override;

 private:
  const std::shared_ptr<ClientSessionInterface> _session;
};

}  // namespace vesk
