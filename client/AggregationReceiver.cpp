#include "client/AggregationReceiver.h"

#include "client/protocol/WireNames.h"
#include "platform/ipc/IPCIncomingCall.h"

namespace vesk {

const char* AggregationReceiver::interfaceName() const { return wire::kReplyInterface; }

void AggregationReceiver::handle(IPCIncomingCall& call) {
  if (call.member() != wire::kSendMessageToClient.name) {
    return call.refuse("org.freedesktop.DBus.Error.UnknownMethod", "the client has no such member");
  }
  std::optional<Dictionary> sessionInfo;
  double timestamp = 0;
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::optional<Dictionary> payload;
  if (!call.read(wire::kSendMessageToClient.arguments, sessionInfo, timestamp, category, type, payload))
    return;
  _client.sendMessageToClient(sessionInfo, timestamp, category, type, payload);
  call.answer();
}

}  // namespace vesk
