// The log of a process that uses the library.
#pragma once

#include <VeskReporting/VeskLog.h>

#include <cstdint>
#include <functional>
#include <memory>
#include <new>
#include <string_view>
#include <utility>

namespace vesk {

/// Lines have the syslog priorities 3 (error), 4 (warning), 6 (info) and 7 (debug). They go to the journal if
/// stderr is connected to it, otherwise to stderr. Thread-safe.
class VeskReportingLogging {
 public:
  using Sink = std::function<void(int level, std::string_view line)>;

  /// Sets the names of the process and of its logging part. Call once, at start-up.
  static void startLogging(const char* processName, const char* facility) noexcept {
    vesk_log_start(processName, facility);
  }
  static void close() noexcept { vesk_log_close(); }

  /// Lines with a higher number are not formatted. Default: 6.
  static void setLevel(int level) noexcept { vesk_log_set_level(level); }
  /// Sends every line to `sink` instead, on the thread that logs. An empty sink restores the default. The
  /// sink must neither throw nor log.
  static void setSink(Sink sink) noexcept {
    if (!sink) return vesk_log_set_sink(nullptr, nullptr, nullptr);
    auto* kept = new (std::nothrow) Sink(std::move(sink));
    if (!kept) return;  // the previous sink stays
    vesk_log_set_sink(
        [](void* context, std::int32_t level, const char* line, std::size_t length) {
          (*static_cast<Sink*>(context))(level, std::string_view(line, length));
        },
        [](void* context) { delete static_cast<Sink*>(context); }, kept);
  }
};

}  // namespace vesk
