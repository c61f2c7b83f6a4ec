// Facts from the machine's firmware: DMI on PCs, the device tree on boards.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// The firmware's value for a fact of the device-information query: "ProductType", "DeviceName", "HWModelStr"
/// or "SerialNumber"; nullopt if there is none. DMI reveals serial numbers to root only. `root`: the
/// directory with /sys and /proc.
std::optional<std::string> firmwareFact(std::string_view key, const std::string& root = {});

}  // namespace vesk
