// The D-Bus object for operators.
#pragma once

#include <memory>

#include "daemon/Diagnostics.h"
#include "daemon/Operations.h"
#include "platform/ipc/IPCConnection.h"

namespace vesk {

/// The object of one connection. Those who do not see all sessions may not use the operations.
std::shared_ptr<IPCExportedObject> diagnosticsObject(std::shared_ptr<const Diagnostics> diagnostics,
                                                     std::shared_ptr<Operations> operations,
                                                     const IPCPeer& viewer);

}  // namespace vesk
