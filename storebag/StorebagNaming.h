// Which storebag a client type uses, which section of it applies to this device, and the daemon's settings.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// Nothing for a client type that has no storebag. Types 7 and 11 share one.
std::optional<std::string_view> storebagNameForClientType(std::int32_t clientType);

/// The section of a storebag for an environment type; nothing for types other than 1 to 4.
std::optional<std::string_view> environmentNameForType(std::int32_t environmentType);

/// The environment types that the daemon itself chooses.
inline constexpr std::int32_t kInternalEnvironment = 2;
inline constexpr std::int32_t kSeedEnvironment = 3;

/// The environment type that a setting stands for; logs an unusable one.
std::int32_t environmentTypeForPreference(const std::optional<Value>& preference);

/// Reads the environment type from the daemon's preferences and makes it the process's.
/// Use `currentEnvironmentType`, which calls this once.
void userDefaultsEnvironment();

/// Fixed on first use for the life of the process. Thread-safe.
std::int32_t currentEnvironmentType();

/// A setting of the daemon's preferences suite as text (a number as decimal text), read afresh on each call.
std::optional<std::string> preferenceStringForKey(std::string_view key);

/// A setting that is a whole number from `least` on; logs an unusable one, which counts as absent.
std::optional<std::uint64_t> preferenceNumberForKey(std::string_view key, std::uint64_t least);

/// Where storebags are fetched from, without a trailing slash: `override`, verbatim, or the server for the
/// kind of build.
std::string storebagServerBaseURLFor(const std::optional<std::string>& override, bool internalBuild);

/// The same for this device, whose setting is read on first use and fixed for the life of the process.
/// Thread-safe.
std::string storebagServerBaseURL();

}  // namespace vesk
