#include <VeskReporting/VeskReportingTypes.h>

#include <cstddef>
#include <iterator>

namespace vesk {

const char* describe(ReportingStatus status) noexcept {
  // In the order of the enumeration.
  static constexpr const char* kTexts[] = {
      "done",
      "queued",
      "too much waits to be sent",
      "no connection to the daemon",
      "no answer in time",
      "refused by the daemon",
      "too large, nested too deeply or no valid text",
      "the file can't be opened",
      "the session belongs to the parent process",
      "a callback must not wait",
      "the session was closed",
      "out of memory, descriptors or threads",
      "too many connections",
  };
  static_assert(std::size(kTexts) == static_cast<std::size_t>(ReportingStatus::TooManyConnections) + 1);
  const auto index = static_cast<std::size_t>(status);
  return index < std::size(kTexts) ? kTexts[index] : "unknown";
}

}  // namespace vesk
