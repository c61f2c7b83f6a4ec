// The log of a process that uses the library.
#pragma once

#include <VeskReporting/values/Export.h>

#include <functional>
#include <string_view>

namespace vesk {

/// Lines carry the syslog priorities 3 (error), 4 (warning), 6 (info) and 7 (debug). They go to the journal
/// when stderr is connected to it, else to stderr. All operations are thread-safe.
class VESK_API VeskReportingLogging {
 public:
  /// Names the process and the part of it that logs; once, at start-up.
  static void startLogging(const char* processName, const char* facility) noexcept;
  static void close() noexcept;

  /// Lines of a higher number are not even formatted. Default: 6.
  static void setLevel(int level) noexcept;
  /// Hands every line to `sink` instead, on the thread that logs; an empty sink restores the default. The
  /// sink must neither throw nor log.
  static void setSink(std::function<void(int level, std::string_view line)> sink) noexcept;
};

}  // namespace vesk
