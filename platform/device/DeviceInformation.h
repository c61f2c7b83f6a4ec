// What device this is, and what its user has agreed to.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/time/Clock.h"

namespace vesk {

/// The device-information query: the fact under `key`, or nothing when the device does not know it. Read
/// afresh on every call; thread-safe.
///
/// A fact comes from /etc/veskreporting/device.toml when that file has the key, else:
/// - "ProductVersion", "BuildVersion": VERSION_ID and BUILD_ID (or VERSION) of /etc/os-release;
/// - "ProductType", "DeviceName", "HWModelStr", "SerialNumber": DMI (/sys/class/dmi/id), else the device tree
///   (/proc/device-tree); "DeviceName" at last NAME of /etc/os-release;
/// - "UniqueDeviceID": 40 hexadecimal digits, derived one-way from /etc/machine-id;
/// - any other key, for example "ReleaseType" or "RegionCode": nothing.
///
/// The files in /etc stand under the root prefix. /sys and /proc do not: they are the kernel's, and a root
/// prefix has none of its own. A fact that is empty, longer than 128 bytes, not UTF-8 or holds control
/// characters counts as unknown, as do the fillers that firmware vendors leave ("Default string").
std::optional<std::string> QNCopyAnswer(std::string_view key);

/// The two-letter country code of the device: the fact "RegionCode", else that of the locale (LC_ALL,
/// LC_MESSAGES, LANG: the first that is set); nothing for a locale without a country, such as C. Upper case.
std::optional<std::string> regionCode();

/// Offset of local time from GMT at `time`, in seconds, east positive. A changed /etc/localtime counts from
/// the next minute on. Thread-safe, and cheap enough for every event: one atomic load within a minute.
int timezoneOffsetSeconds(WallTime time);

/// The user's consent to diagnostics submission. On this platform it is the boolean `diagnosticsSubmission`
/// of the preferences suite "com.corvane.veskreporting"; nobody who said nothing has agreed to anything.
bool diagnosticsSubmissionConsent();

}  // namespace vesk
