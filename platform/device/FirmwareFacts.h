// What the firmware says about the machine: DMI on PCs, the device tree on boards.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// The firmware's word for a fact of the device-information query, or nothing: "ProductType", "DeviceName",
/// "HWModelStr", "SerialNumber". DMI gives serial numbers to root only. `root`: where /sys and /proc are.
std::optional<std::string> firmwareFact(std::string_view key, const std::string& root = {});

}  // namespace vesk
