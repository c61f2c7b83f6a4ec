// The log of a process that uses the library.
#pragma once

#include <VeskReporting/values/Export.h>

#include <functional>
#include <string_view>

namespace vesk {

/// Lines have the syslog priorities 3 (error), 4 (warning), 6 (info) and 7 (debug). They go to the journal if
/// stderr is connected to it, otherwise to stderr. Thread-safe.
class VESK_API VeskReportingLogging {
 public:
  /// Sets the names of the process and of its logging part. Call once, at start-up.
  static void startLogging(const char* processName, const char* facility) noexcept;
  static void close() noexcept;

  /// Lines with a higher number are not formatted. Default: 6.
  static void setLevel(int level) noexcept;
  /// Sends every line to `sink` instead, on the thread that logs. An empty sink restores the default. The
  /// sink must neither throw nor log.
  static void setSink(std::function<void(int level, std::string_view line)> sink) noexcept;
};

}  // namespace vesk
