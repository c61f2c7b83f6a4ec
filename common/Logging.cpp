#include <VeskReporting/VeskReportingLogging.h>

#include <utility>

#include "platform/log/SystemLog.h"

namespace vesk {

void VeskReportingLogging::startLogging(const char* processName, const char* facility) noexcept {
  try {
    SystemLog::open(processName ? processName : "", facility ? facility : "");
  } catch (...) {
    // Out of memory: lines are logged without the names.
  }
}

void VeskReportingLogging::close() noexcept { SystemLog::close(); }

void VeskReportingLogging::setLevel(int level) noexcept { SystemLog::setLevel(level); }

void VeskReportingLogging::setSink(std::function<void(int level, std::string_view line)> sink) noexcept {
  try {
    if (!sink) return SystemLog::setSink(nullptr);
    SystemLog::setSink([sink = std::move(sink)](LogLevel level, std::string_view line) {
      sink(static_cast<int>(level), line);
    });
  } catch (...) {
    // Out of memory: the previous sink stays.
  }
}

}  // namespace vesk
