// The client's own object on the wire.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>

#include <memory>
#include <utility>

#include "platform/ipc/IPCConnection.h"

namespace vesk {

/// Hands the messages that the daemon calls it with to the client's handler, if it has one. For one thread.
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
