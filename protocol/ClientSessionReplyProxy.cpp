#include "protocol/ClientSessionReplyProxy.h"

#include "protocol/WireNames.h"

namespace vesk {

void ClientSessionReplyProxy::sendMessageToClient(const std::optional<Dictionary>& sessionInfo,
                                                  double timestamp, std::uint16_t category,
                                                  std::uint16_t type,
                                                  const std::optional<Dictionary>& payload) {
  _connection->callRemoteObject({wire::kReplyInterface,
                                 wire::kSendMessageToClient.name,
                                 {sessionInfo, timestamp, category, type, payload}},
                                _errorHandler);
}

}  // namespace vesk
