#include "session/ReportingStates.h"

#include "platform/log/SystemLog.h"

namespace vesk {

void updateReportingStates(const BackendSet& backends, const std::optional<Dictionary>& userInfo) {
  for (const auto& [name, backend] : backends) {
    backend->setUserInfoDict(userInfo);
    backend->updateState();
  }
}

void syncReportingStates(const BackendSet& backends, const BackendSet* parent) {
  for (const auto& [name, backend] : backends) {
    if (backend->state() == BackendStateOverride) continue;
    const auto above = parent ? findBackend(*parent, name) : nullptr;
    if (above && above->state() == BackendStateEnabled) {
      backend->setState(BackendStateEnabled);
      backend->setSamplingThreshold(above->samplingThreshold());
    } else {
      backend->setState(BackendStateDisabled);
    }
  }
}

void noteMissingParent(const BackendSet& backends, std::uint32_t sessionID) {
  for (const auto& [name, backend] : backends) {
    if (backend->hierarchy() < 1) continue;
    VESK_LOG_INFO("syncReportingStates: child session %u (backend %s) is missing its parent", sessionID,
                  name.c_str());
  }
}

Dictionary describeStates(const BackendSet& backends) {
  MutableDictionary states;
  for (const auto& [name, backend] : backends) {
    MutableDictionary each(Dictionary{{"state", std::string(nameOfState(backend->state()))}});
    const auto reason = backend->state() == BackendStateEnabled ? std::nullopt : backend->stateReason();
    if (reason) each.set("reason", *reason);
    states.set(name, each.share());
  }
  return states.share();
}

BackendNames fetchReportingStates(const BackendSet& backends) {
  BackendNames enabled;
  for (const auto& [name, backend] : backends) {
    if (backend->state() == BackendStateEnabled) enabled.push_back(name);
  }
  return enabled;
}

}  // namespace vesk
