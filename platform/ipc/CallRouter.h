// Routes incoming calls to the exported object. Private to platform/ipc.
#pragma once

#include <functional>
#include <map>
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

/// Passes method calls to the objects exported under their paths, serves D-Bus's standard interfaces, and
/// answers other calls with the standard errors. Drops signals and stray answers. Used on the connection's
/// thread.
class CallRouter {
 public:
  /// `owner`: see IPCIncomingCall. `limits`: for the arguments of one call.
  CallRouter(std::string objectPath, std::string connectionName, std::shared_ptr<Outbox> outbox,
             const ExtensionOwner& owner, CodecLimits limits = {});

  using Objects = std::map<std::string, std::shared_ptr<IPCExportedObject>, std::less<>>;

  /// `object` is exported under the router's own path.
  void setExportedObject(std::shared_ptr<IPCExportedObject> object, Objects others = {});
  /// Detaches the objects; they receive no further calls. The caller releases them.
  Objects takeExportedObjects() { return std::exchange(_objects, {}); }

  void route(Message& message);

 private:
  std::shared_ptr<IPCExportedObject> objectAt(std::string_view path) const;
  void serveObject(IPCIncomingCall& call, IPCExportedObject& object);
  void servePeer(IPCIncomingCall& call);
  void serveIntrospectable(IPCIncomingCall& call, std::string_view path);
  void serveProperties(IPCIncomingCall& call, const IPCExportedObject& object);
  void warn(std::string_view member, const char* what);

  const std::string _objectPath;
  const std::string _connectionName;
  const std::shared_ptr<Outbox> _outbox;
  const ExtensionOwner _owner;
  const CodecLimits _limits;
  Objects _objects;
  WarningBurst _warnings;
};

}  // namespace vesk
