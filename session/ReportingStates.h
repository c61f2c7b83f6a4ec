// Decides which of a session's backends report.
#pragma once

#include <cstdint>
#include <optional>

#include <VeskReporting/values/Value.h>
#include "protocol/ClientSessionInterface.h"
#include "session/BackendSet.h"

namespace vesk {

/// Updates each backend's state for `userInfo`.
void updateReportingStates(const BackendSet& backends, const std::optional<Dictionary>& userInfo);

/// Enables the backends that the parent has enabled, with the parent's sampling thresholds, and disables the
/// others. Skips backends in the override band. `parent`: null before the parent's first start.
void syncReportingStates(const BackendSet& backends, const BackendSet* parent);

/// Logs a line for each backend with a hierarchy above 0, for a session without a parent.
void noteMissingParent(const BackendSet& backends, std::uint32_t sessionID);

/// For operators: each backend's `state` and, unless it is enabled, the `reason`, by name.
Dictionary describeStates(const BackendSet& backends);

/// The names of the enabled backends.
BackendNames fetchReportingStates(const BackendSet& backends);

}  // namespace vesk
