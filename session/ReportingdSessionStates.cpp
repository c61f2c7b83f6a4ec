// A session's backends and their reporting states.
#include <VeskReporting/VeskReportingKeys.h>

#include <algorithm>

#include "platform/log/SystemLog.h"
#include "session/ReportingdSession.h"

namespace vesk {

void ReportingdSession::createBackendsWithStorebag(const std::optional<Dictionary>& storebag) {
  VESK_LOG_DEBUG("createBackendsWithStorebag: Creating backends for session %u", sessionID());
  auto created = createBackends(storebag, sessionInfo(), userInfo(), _deviceid.data(),
                                _services.libraryVersion, _connection->peer().user, _services.backends);
  SharedBackends next;
  if (created) {
    for (const auto& [name, backend] : *created) backend->setCombinedSessionIDString(_sessionIDString);
    next = std::make_shared<const BackendSet>(std::move(*created));
  }
  SharedBackends previous;
  {
    MutexLock lock(_mutex);
    previous = std::exchange(_backends, std::move(next));
  }
  // Started a second time: the previous backends send what they hold if allowed, then end.
  if (previous) {
    flushBackends(*previous);
    cleanupBackends(*previous);
  }
  internalSendMessage(deviceDictionary(_services.libraryVersion, _services.backends.regionCode()), 0, 0);
}

void ReportingdSession::cleanupBackends(const BackendSet& backends) {
  for (const auto& [name, backend] : backends) backend->cleanup();
}

void ReportingdSession::updateSessionWithDefaultSessionInfo() {
  // The level is only final once the states are decided. No other session may find this one in its family
  // before that.
  RecursiveMutexLock monitor(_sessionDelegate->monitor());
  _sessionDelegate->userInfoUpdatedForSession(*this);
  updateReportingStates();
  _sessionDelegate->updateDownstreamSessions(*this);
}

void ReportingdSession::updateReportingStates() {
  auto set = backends();
  if (!set) return;
  auto currentUserInfo = userInfo();
  for (const auto& [name, backend] : *set) {
    backend->setUserInfoDict(currentUserInfo);
    backend->updateState();
  }
}

void ReportingdSession::syncReportingStates() {
  RecursiveMutexLock monitor(_sessionDelegate->monitor());
  auto parent = _sessionDelegate->parentSessionForChild(*this);
  std::optional<BackendNames> enabledInParent;
  if (parent) enabledInParent = parent->fetchReportingStates();
  auto set = backends();
  if (!set) return;
  for (const auto& [key, backend] : *set) {
    const std::string& name = backend->name();
    if (!parent) {
      if (backend->hierarchy() >= 1) {
        VESK_LOG_INFO("syncReportingStates: child session %u (backend %s) is missing its parent", sessionID(),
                      name.c_str());
      }
    } else if (backend->state() == BackendStateOverride) {
      continue;
    } else if (enabledInParent &&
               std::find(enabledInParent->begin(), enabledInParent->end(), name) != enabledInParent->end()) {
      backend->setState(BackendStateEnabled);
      backend->setSamplingThreshold(parent->samplingThresholdWithBackendName(name));
    } else {
      backend->setState(BackendStateDisabled);
    }
  }
}

std::optional<BackendNames> ReportingdSession::fetchReportingStates() const {
  auto set = backends();
  if (!set) return std::nullopt;
  BackendNames enabled;
  for (const auto& [name, backend] : *set) {
    if (backend->state() == BackendStateEnabled) enabled.push_back(name);
  }
  return enabled;
}

std::optional<Value> ReportingdSession::samplingThresholdWithBackendName(const std::string& name) const {
  auto set = backends();
  if (!set) return std::nullopt;
  for (const auto& [key, backend] : *set) {
    if (backend->name() == name) return backend->samplingThreshold();
  }
  return std::nullopt;
}

}  // namespace vesk
