// A session within its family: user info, aggregation, combined session IDs.
#include <VeskReporting/VeskReportingKeys.h>

#include "platform/log/SystemLog.h"
#include "protocol/ClientSessionReplyProxy.h"
#include "session/ReportingdSession.h"
#include "util/ReportingdUtil.h"

namespace vesk {

namespace {

// Whether both have the same text under `key`.
bool sameText(const std::optional<Dictionary>& a, const std::optional<Dictionary>& b, const char* key) {
  auto first = a ? a->text(key) : std::nullopt;
  auto second = b ? b->text(key) : std::nullopt;
  return first && second && *first == *second;
}

}  // namespace

std::shared_ptr<const std::string> ReportingdSession::keyFor(const std::optional<Dictionary>& userInfo) {
  return std::make_shared<const std::string>(correlationKeyForUserInfo(userInfo.value_or(Dictionary())));
}

void ReportingdSession::receivedUserInfo(const std::optional<Dictionary>& userInfo) {
  auto stored = this->userInfo();
  if (stored) {
    if (sameText(userInfo, stored, kVeskReportingUserInfoClientName) &&
        sameText(userInfo, stored, kVeskReportingUserInfoServiceName)) {
      return;
    }
  } else if (!userInfo) {
    return;
  }
  VESK_LOG_DEBUG("receivedUserInfo: Received new user info for session %u", sessionID());
  {
    auto key = keyFor(userInfo);
    MutexLock lock(_mutex);
    _userInfo = userInfo;
    _correlationKey = std::move(key);
  }
  updateSessionWithDefaultSessionInfo();
}

std::int32_t ReportingdSession::getSessionHierarchy() const {
  auto set = backends();
  auto backend = set ? findBackend(*set, kVeskReportingBackendHTTPPost) : nullptr;
  return backend ? backend->hierarchy() : 0;
}

void ReportingdSession::aggregateMessage(const std::optional<Dictionary>& sessionInfo, double timestamp,
                                         std::uint16_t category, std::uint16_t type,
                                         const std::optional<Dictionary>& payload) {
  // A message at the top of its family must not wait for the monitor, which is held while a storebag is
  // fetched.
  if (_sessionDelegate->mayHaveAncestor(*this)) {
    // Declared outside the lock's scope, so that the lock is released first if this is the session's last
    // reference.
    std::shared_ptr<ReportingdSession> ancestor;
    RecursiveMutexLock monitor(_sessionDelegate->monitor());
    ancestor = _sessionDelegate->getAncestorWithAggregatorForSession(*this);
    if (ancestor) {
      ancestor->sendToAggregator(sessionInfo, timestamp, category, type, payload);
      return;
    }
  }
  if (hasAggregator()) sendToAggregator(this->sessionInfo(), timestamp, category, type, payload);
}

void ReportingdSession::sendToAggregator(const std::optional<Dictionary>& sessionInfo, double timestamp,
                                         std::uint16_t category, std::uint16_t type,
                                         const std::optional<Dictionary>& payload) {
  ClientSessionReplyProxy proxy(_connection, [&](const std::string& error) {
    // While this session ends, its client is usually gone. Its last messages are not counted as lost.
    if (!_isEnding) _services.backends.counters.count("session", DropReason::NotAggregated);
    if (!undeliveredBurstBegins()) return;
    VESK_LOG_ERROR("sendMessageWithDictionary: Failed to get remote object proxy: %s", error.c_str());
  });
  proxy.sendMessageToClient(sessionInfo, timestamp, category, type, payload);
}

bool ReportingdSession::undeliveredBurstBegins() {
  MutexLock lock(_mutex);
  return _undelivered.begins();
}

void ReportingdSession::shutdownSessionAggregation() {
  VESK_LOG_DEBUG("shutdownSessionAggregation: Disable aggregation module for session %u", sessionID());
  if (_hasAggregator.exchange(false)) sendToAggregator(std::nullopt, 0, 0, 0, std::nullopt);
}

void ReportingdSession::updateCombinedSessionID() {
  auto parentID = _sessionDelegate->parentSessionIDStringForSession(*this);
  if (!parentID) return;
  std::string combined = *parentID + "." + _sessionIDString;
  VESK_LOG_DEBUG("updateCombinedSessionID: Updating combined session ID '%s' for session %u backends",
                 combined.c_str(), sessionID());
  auto set = backends();
  if (!set) return;
  for (const auto& [name, backend] : *set) backend->setCorrelatedSessionID(combined);
}

}  // namespace vesk
