// Settings from this device's preferences: environment, consent, storebag server, limits.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// The user's consent to diagnostics submission: the boolean `diagnosticsSubmission` in the preferences suite
/// "com.corvane.veskreporting". False if not set.
bool diagnosticsSubmissionConsent();

/// The environment types that the daemon chooses without a setting.
inline constexpr std::int32_t kInternalEnvironment = 2;
inline constexpr std::int32_t kSeedEnvironment = 3;

/// The environment type for a setting. Logs an unusable one.
std::int32_t environmentTypeForPreference(const std::optional<Value>& preference);

/// Sets the process's environment type from the daemon's preferences. Called once, by
/// `currentEnvironmentType`; call that instead.
void userDefaultsEnvironment();

/// Determined on first use and fixed for the life of the process. Thread-safe.
std::int32_t currentEnvironmentType();

/// A setting of the daemon's preferences suite as text (a number as decimal text), read anew by each call.
std::optional<std::string> preferenceStringForKey(std::string_view key);

/// A boolean setting; false if it is absent or of another type.
bool preferenceFlagForKey(std::string_view key);

/// A setting that must be an integer of at least `least`. Logs an unusable one and treats it as absent.
std::optional<std::uint64_t> preferenceNumberForKey(std::string_view key, std::uint64_t least);

/// The base URL of the storebag server, without a trailing slash: `override` unchanged, or the server for the
/// kind of build.
std::string storebagServerBaseURLFor(const std::optional<std::string>& override, bool internalBuild);

/// The base URL for this device. The setting is read on first use and fixed for the life of the process.
/// Thread-safe.
std::string storebagServerBaseURL();

}  // namespace vesk
