// The object that the client exports to the daemon.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>

#include <memory>
#include <utility>

#include "platform/ipc/IPCConnection.h"

namespace vesk {

/// Passes the messages that the daemon sends to the client's handler, if there is one. Not thread-safe.
class AggregationReceiver final : public IPCExportedObject {
 public:
  void setHandler(std::shared_ptr<const AggregationHandler> handler) noexcept {
    _handler = std::move(handler);
  }

  const char* interfaceName() const override;
  void handle(IPCIncomingCall& call) override;

 private:
  std::shared_ptr<const AggregationHandler> _handler;
};

}  // namespace vesk
