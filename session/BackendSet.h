// The backends of one session, created from its storebag.
#pragma once

#include <sys/types.h>

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "backends/VeskReportingBackend.h"

namespace vesk {

/// Backends with their names, in the storebag's order. Immutable once shared between threads.
using BackendSet = std::vector<std::pair<std::string, std::shared_ptr<VeskReportingBackend>>>;

/// Creates a backend for each entry of the storebag's section that the factory knows, and gives it the
/// session's and the device's identity. Returns nullopt, with a line of level 3, if the storebag or the
/// session info is missing. `deviceID`: at most 40 characters, copied. `libraryVersion`: of the client
/// library. Thread-safe.
std::optional<BackendSet> createBackends(const std::optional<Dictionary>& storebag,
                                         const std::optional<Dictionary>& sessionInfo,
                                         const std::optional<Dictionary>& userInfo, std::string_view deviceID,
                                         const std::string& libraryVersion, const BackendClient& client,
                                         const BackendServices& services);

/// The backend with that name, or null.
std::shared_ptr<VeskReportingBackend> findBackend(const BackendSet& backends, std::string_view name);

/// The device description in a session's start message: eight entries on internal builds, otherwise only
/// whether the time zone is set automatically.
Dictionary deviceDictionary(const std::string& libraryVersion, const std::optional<std::string>& countryCode);

}  // namespace vesk
