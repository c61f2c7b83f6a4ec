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

// For each key in the order of preference.
constexpr Source kSources[] = {
    {"ProductType", "/sys/class/dmi/id/product_name"},   {"ProductType", "/proc/device-tree/model"},
    {"DeviceName", "/sys/class/dmi/id/product_family"},  {"DeviceName", "/sys/class/dmi/id/product_name"},
    {"DeviceName", "/proc/device-tree/model"},           {"HWModelStr", "/sys/class/dmi/id/board_name"},
    {"HWModelStr", "/proc/device-tree/compatible"},      {"SerialNumber", "/sys/class/dmi/id/product_serial"},
    {"SerialNumber", "/proc/device-tree/serial-number"},
};

// Vendors ship these in place of an answer.
constexpr std::array<std::string_view, 9> kFillers = {"Default string",
                                                      "Not Applicable",
                                                      "Not Specified",
                                                      "None",
                                                      "O.E.M.",
                                                      "System Product Name",
                                                      "System Serial Number",
                                                      "To Be Filled By O.E.M.",
                                                      "To be filled by O.E.M."};

// Device-tree texts end with a NUL, and "compatible" is a row of them, the board's own first.
std::string firstText(std::string_view bytes) {
  return std::string(trimmed(bytes.substr(0, bytes.find('\0'))));
}

}  // namespace

std::optional<std::string> firmwareFact(std::string_view key, const std::string& root) {
  for (const Source& source : kSources) {
    if (source.key != key) continue;
    SmallFile file = readSmallFile(root + source.path, 4096);
    if (!file.bytes) continue;
    std::string fact = firstText(*file.bytes);
    if (!fact.empty() && std::find(kFillers.begin(), kFillers.end(), fact) == kFillers.end()) return fact;
  }
  return std::nullopt;
}

}  // namespace vesk
