// Facts about the device and its build, and conversions that several units share.
#pragma once

#include <sys/time.h>

#include <cstddef>
#include <optional>
#include <string>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// Facts of the device, queried anew by each call; nullopt if unknown.
std::optional<Text> deviceProductVersion();
std::optional<Text> deviceBuildVersion();
std::optional<Text> deviceProductType();
std::optional<Text> deviceName();
std::optional<Text> deviceHardwareModel();
std::optional<Text> deviceSerialNumber();

/// Writes the device's unique identifier with a terminating NUL into `buffer` and sets the buffer's last byte
/// to 0. An identifier that doesn't fit gives an empty text. If there is no identifier, the buffer is
/// unchanged. Callers pass 41 bytes, for 40 digits.
void copyUniqueDeviceID(char* buffer, std::size_t size);

/// True on an internal build. Determined on first use and fixed for the life of the process.
bool isInternalBuild();

/// Client name and service name of `userInfo` in lower case, separated by a colon. Missing names are empty.
/// Sessions with the same key form a family.
std::string correlationKeyForUserInfo(const Dictionary& userInfo);

/// The time in seconds, with microsecond precision.
double secondsFromTimeval(const timeval& time) noexcept;

}  // namespace vesk
