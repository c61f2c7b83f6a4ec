#include "client/AggregationReceiver.h"

#include "platform/ipc/IPCIncomingCall.h"
#include "platform/log/SystemLog.h"
#include "protocol/WireNames.h"

namespace vesk {

const char* AggregationReceiver::interfaceName() const { return wire::kReplyInterface; }

void AggregationReceiver::handle(IPCIncomingCall& call) {
  if (call.member() != wire::kSendMessageToClient.name) {
    return call.refuse("org.freedesktop.DBus.Error.UnknownMethod", "the client has no such member");
  }
  AggregatedMessage message;
  if (!call.read(wire::kSendMessageToClient.arguments, message.sessionInfo, message.timestamp,
                 message.category, message.type, message.payload)) {
    return;
  }
  try {
    if (_handler) (*_handler)(message);
  } catch (...) {
    VESK_LOG_ERROR("VeskReporting: an aggregation handler threw an exception");
  }
  call.answer();
}

}  // namespace vesk
