#include "platform/device/FirmwareFacts.h"

#include <algorithm>
#include <array>

#include "platform/files/SmallFile.h"
#include "platform/text/ASCII.h"

namespace vesk {

namespace {

struct Source {
  std::string_view key;
  const char* path;
};

// In order of preference for each key.
constexpr Source kSources[] = {
    {"ProductType", "/sys/class/dmi/id/product_name"},   {"ProductType", "/proc/device-tree/model"},
    {"DeviceName", "/sys/class/dmi/id/product_family"},  {"DeviceName", "/sys/class/dmi/id/product_name"},
    {"DeviceName", "/proc/device-tree/model"},           {"HWModelStr", "/sys/class/dmi/id/board_name"},
    {"HWModelStr", "/proc/device-tree/compatible"},      {"SerialNumber", "/sys/class/dmi/id/product_serial"},
    {"SerialNumber", "/proc/device-tree/serial-number"},
};

// Placeholders that vendors leave.
constexpr std::array<std::string_view, 9> kFillers = {"Default string",
                                                      "Not Applicable",
                                                      "Not Specified",
                                                      "None",
                                                      "O.E.M.",
                                                      "System Product Name",
                                                      "System Serial Number",
                                                      "To Be Filled By O.E.M.",
                                                      "To be filled by O.E.M."};

// Device-tree text ends with a NUL. "compatible" is a sequence of such texts, of which the board's own is
// first.
std::string firstText(std::string_view bytes) {
  return std::string(trimmed(bytes.substr(0, bytes.find('\0'))));
}

}  // namespace

std::optional<std::string> firmwareFact(std::string_view key, const std::string& root) {
  for (const Source& source : kSources) {
    if (source.key != key) continue;
    const auto file = readSmallFile(root + source.path, 4096);
    if (!file) continue;
    std::string fact = firstText(*file);
    if (!fact.empty() && std::find(kFillers.begin(), kFillers.end(), fact) == kFillers.end()) return fact;
  }
  return std::nullopt;
}

}  // namespace vesk
