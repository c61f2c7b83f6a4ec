// Makes backends by their names in the storebag.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "backends/VeskReportingBackend.h"

namespace vesk {

/// Makes the backend that a storebag lists under `name`. Returns null for an unknown name, for a Wren backend
/// on a "Bramble" device (both logged at level 3), and if the backend can't use `profile`.
std::shared_ptr<VeskReportingBackend> newBackendWithName(const std::string& name,
                                                         const std::optional<Dictionary>& profile,
                                                         const BackendIdentity& identity,
                                                         const BackendServices& services);

/// Whether `newBackendWithName` knows the name, on this device.
bool isBackendName(std::string_view name);

}  // namespace vesk
