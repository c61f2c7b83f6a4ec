#include "session/SessionAggregator.h"

#include "platform/log/SystemLog.h"
#include "protocol/ClientSessionReplyProxy.h"

namespace vesk {

void SessionAggregator::shutdown() {
  if (_hasAggregator.exchange(false)) sendToAggregator(std::nullopt, 0, 0, 0, std::nullopt);
}

void SessionAggregator::sendToAggregator(const std::optional<Dictionary>& sessionInfo, double timestamp,
                                         std::uint16_t category, std::uint16_t type,
                                         const std::optional<Dictionary>& payload) {
  ClientSessionReplyProxy proxy(_connection, [&](const std::string& error) {
    if (!_isEnding) _counters.count("session", DropReason::NotAggregated);
    if (!undeliveredBurstBegins()) return;
    VESK_LOG_ERROR("sendMessageWithDictionary: Failed to get remote object proxy: %s", error.c_str());
  });
  proxy.sendMessageToClient(sessionInfo, timestamp, category, type, payload);
}

bool SessionAggregator::undeliveredBurstBegins() {
  MutexLock lock(_mutex);
  return _undelivered.begins();
}

}  // namespace vesk
