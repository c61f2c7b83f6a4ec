// What device and build the daemon runs on, and small conversions that several units share.
#pragma once

#include <sys/time.h>

#include <cstddef>
#include <optional>
#include <string>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// Facts of the device, asked for anew on every call; nothing when the device does not know one.
std::optional<Text> deviceProductVersion();
std::optional<Text> deviceBuildVersion();
std::optional<Text> deviceProductType();
std::optional<Text> deviceName();
std::optional<Text> deviceHardwareModel();
std::optional<Text> deviceSerialNumber();

/// Writes the device's unique identifier with a terminating NUL into `buffer`, and 0 into its last byte. The
/// buffer keeps what it held when there is no identifier. One that does not fit with its terminator leaves an
/// empty text; callers pass 41 bytes, for 40 digits.
void copyUniqueDeviceID(char* buffer, std::size_t size);

/// True when the device runs an internal build. Found out on first use and fixed for the life of the process.
bool isInternalBuild();

/// Client name and service name of `userInfo`, lower-cased, with a colon between; what is missing is empty.
/// Sessions with the same key belong together.
std::string correlationKeyForUserInfo(const Dictionary& userInfo);

/// Seconds with microseconds.
double secondsFromTimeval(const timeval& time) noexcept;

}  // namespace vesk
