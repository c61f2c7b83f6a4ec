// From an incoming message to the exported object. Private to platform/ipc.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "platform/ipc/BusCodec.h"
#include "platform/ipc/BusHandles.h"
#include "platform/ipc/BusReplies.h"
#include "platform/ipc/ExtensionTokens.h"
#include "platform/ipc/IPCConnection.h"
#include "platform/ipc/OneWayDecoder.h"
#include "platform/ipc/WarningBurst.h"

namespace vesk {

/// Hands method calls to the object exported under one path, answers introspection, and answers everything
/// else with the errors that D-Bus has for it. Signals and stray answers are dropped. On the bus's thread.
class CallRouter {
 public:
  /// `owner`: as IPCIncomingCall's. `limits`: of the arguments of one call.
  CallRouter(std::string objectPath, std::string connectionName, std::shared_ptr<BusReplies> replies,
             const ExtensionOwner& owner, CodecLimits limits = {});

  void setExportedObject(std::shared_ptr<IPCExportedObject> object) { _object = std::move(object); }
  /// No call reaches the object any more; the caller lets go of it.
  std::shared_ptr<IPCExportedObject> takeExportedObject() { return std::exchange(_object, nullptr); }

  void route(sd_bus_message* message);

  /// Serves a message that has not been through sd-bus, and never comes there. False when it has to.
  bool routeOneWay(std::string_view message);

 private:
  void serve(IPCIncomingCall& call);
  void introspect(sd_bus_message* message, std::string_view path);
  void refuse(sd_bus_message* message, const char* errorName, const char* text);
  void warn(std::string_view member, const char* what);

  const std::string _objectPath;
  const std::string _connectionName;
  const std::shared_ptr<BusReplies> _replies;
  const ExtensionOwner _owner;
  const CodecLimits _limits;
  OneWayDecoder _decoder;
  std::shared_ptr<IPCExportedObject> _object;
  WarningBurst _warnings;
};

}  // namespace vesk
