// Facts about the device.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/time/Clock.h"

namespace vesk {

/// The device-information query: the fact under `key`, or nullopt if the device does not know it. Read anew
/// by each call. Thread-safe.
///
/// A fact comes from /etc/veskreporting/device.toml if that file has the key, otherwise from:
/// - "ProductVersion", "BuildVersion": VERSION_ID and BUILD_ID (or VERSION) of /etc/os-release;
/// - "ProductType", "DeviceName", "HWModelStr", "SerialNumber": DMI (/sys/class/dmi/id), otherwise the device
///   tree (/proc/device-tree); "DeviceName" finally NAME of /etc/os-release;
/// - "UniqueDeviceID": 40 hexadecimal digits, derived one-way from /etc/machine-id;
/// - any other key, for example "ReleaseType" or "RegionCode": nowhere.
///
/// The root prefix applies to the files in /etc, but not to the kernel's /sys and /proc. A fact that is
/// empty, longer than 128 bytes, not UTF-8 or contains control characters counts as unknown, and so do
/// placeholders of firmware vendors ("Default string").
std::optional<std::string> QNCopyAnswer(std::string_view key);

/// The device's two-letter country code in upper case: the fact "RegionCode", otherwise from the locale (the
/// first of LC_ALL, LC_MESSAGES and LANG that is set); nullopt for a locale without a country, such as C.
std::optional<std::string> regionCode();

/// Offset of local time from GMT at `time`, in seconds, positive to the east. Notices a changed
/// /etc/localtime within a minute. Thread-safe, and cheap enough for every event: one atomic load within a
/// minute.
int timezoneOffsetSeconds(WallTime time);

}  // namespace vesk
