#include "platform/device/FirmwareFacts.h"

#include <algorithm>
#include <array>

#include "platform/files/SmallFile.h"

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
std::string trimmed(std::string_view text) {
  text = text.substr(0, text.find('\0'));
  constexpr std::string_view kSpace = " \t\r\n";
  std::size_t first = text.find_first_not_of(kSpace);
  if (first == std::string_view::npos) return {};
  return std::string(text.substr(first, text.find_last_not_of(kSpace) - first + 1));
}

}  // namespace

std::optional<std::string> firmwareFact(std::string_view key) {
  for (const Source& source : kSources) {
    if (source.key != key) continue;
    SmallFile file = readSmallFile(source.path, 4096);
    if (!file.bytes) continue;
    std::string fact = trimmed(*file.bytes);
    if (!fact.empty() && std::find(kFillers.begin(), kFillers.end(), fact) == kFillers.end()) return fact;
  }
  return std::nullopt;
}

}  // namespace vesk
