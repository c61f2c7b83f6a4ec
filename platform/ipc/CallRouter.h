// Routes incoming calls to the exported object. Private to platform/ipc.
#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "platform/ipc/Codec.h"
#include "platform/ipc/ExtensionTokens.h"
#include "platform/ipc/IPCConnection.h"
#include "platform/ipc/Outbox.h"
#include "platform/ipc/WarningBurst.h"

namespace vesk {

class IPCIncomingCall;

/// Passes method calls to the object exported under one path, serves D-Bus's standard interfaces, and answers
/// other calls with the standard errors. Drops signals and stray answers. Used on the connection's thread.
class CallRouter {
 public:
  /// `owner`: see IPCIncomingCall. `limits`: for the arguments of one call.
  CallRouter(std::string objectPath, std::string connectionName, std::shared_ptr<Outbox> outbox,
             const ExtensionOwner& owner, CodecLimits limits = {});

  void setExportedObject(std::shared_ptr<IPCExportedObject> object) { _object = std::move(object); }
  /// Detaches the object; it receives no further calls. The caller releases it.
  std::shared_ptr<IPCExportedObject> takeExportedObject() { return std::exchange(_object, nullptr); }

  void route(Message& message);

 private:
  void serveObject(IPCIncomingCall& call);
  void servePeer(IPCIncomingCall& call);
  void serveIntrospectable(IPCIncomingCall& call, std::string_view path);
  void serveProperties(IPCIncomingCall& call);
  void warn(std::string_view member, const char* what);

  const std::string _objectPath;
  const std::string _connectionName;
  const std::shared_ptr<Outbox> _outbox;
  const ExtensionOwner _owner;
  const CodecLimits _limits;
  std::shared_ptr<IPCExportedObject> _object;
  WarningBurst _warnings;
};

}  // namespace vesk
