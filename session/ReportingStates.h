// Which of a session's backends report.
#pragma once

#include <cstdint>
#include <optional>

#include <VeskReporting/values/Value.h>
#include "protocol/ClientSessionInterface.h"
#include "session/BackendSet.h"

namespace vesk {

/// Decides each backend's state anew.
void updateReportingStates(const BackendSet& backends, const std::optional<Dictionary>& userInfo);

/// A child's backends report where its parent's do, and take their sampling thresholds, except those that
/// wait in the override band. `parent`: null before the parent's first start.
void syncReportingStates(const BackendSet& backends, const BackendSet* parent);

/// Writes a line for each backend that is a child's, for a session that has no parent.
void noteMissingParent(const BackendSet& backends, std::uint32_t sessionID);

/// The names of the enabled backends.
BackendNames fetchReportingStates(const BackendSet& backends);

}  // namespace vesk
