// The backends of one session, made from its storebag.
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

/// From backend name to backend, in the storebag's order. Immutable once shared between threads.
using BackendSet = std::vector<std::pair<std::string, std::shared_ptr<VeskReportingBackend>>>;

/// Makes a backend for every entry of the storebag's section that the factory knows, and stamps each with the
/// session's and the device's identity. Nothing, and a level-3 line, without storebag or session info.
/// `deviceID`: at most 40 characters, copied. `libraryVersion`: of the client library. `user`: whose the
/// client is. Thread-safe.
std::optional<BackendSet> createBackends(const std::optional<Dictionary>& storebag,
                                         const std::optional<Dictionary>& sessionInfo,
                                         const std::optional<Dictionary>& userInfo, std::string_view deviceID,
                                         const std::string& libraryVersion, uid_t user,
                                         const BackendServices& services);

/// The backend under that name, or null.
std::shared_ptr<VeskReportingBackend> findBackend(const BackendSet& backends, std::string_view name);

/// What the start message of a session tells about the device: eight entries on internal builds, else only
/// whether it sets its time zone by itself.
Dictionary deviceDictionary(const std::string& libraryVersion, const std::optional<std::string>& countryCode);

}  // namespace vesk
