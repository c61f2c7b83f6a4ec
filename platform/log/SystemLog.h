// The system log: numeric levels, to the journal or to stderr.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>

#include "platform/log/LogLevel.h"

namespace vesk {

/// Writes the process's log lines, to stderr as "2026-11-24 20:31:29.123 name[pid] <level> text", in UTC.
/// Where stderr is connected to the journal they go there instead: through `setJournal`, or as "<level>text",
/// which the journal understands. Safe from any thread, also under other locks (it takes none but the rate
/// limit's, for a look-up); never throws, raises no SIGPIPE. Control characters in a line are shown as \xNN,
/// so that text from outside can't forge a line.
class SystemLog {
 public:
  using Sink = std::function<void(LogLevel, std::string_view line)>;

  /// Opens the log for a process. Lines appear without that (and after `close`) too, without its name.
  static void open(std::string_view processName, std::string_view facility);
  static void close() noexcept;

  /// Lines of a higher number than `level` are not formatted at all. Default: 6.
  static void setLevel(int level) noexcept { _level.store(level, std::memory_order_relaxed); }
  static bool isOn(LogLevel level) noexcept {
    return static_cast<int>(level) <= _level.load(std::memory_order_relaxed);
  }

  /// How long a line waits for a reader of stderr that is behind; a line that it has no room for then is
  /// lost. Default: not at all, and lines are cut to 4096 bytes, because a library must not hold up its host.
  /// A process of the project's own, whose lines somebody looks for, can wait a little.
  static void setPatience(std::chrono::milliseconds patience) noexcept {
    _patience.store(static_cast<int>(patience.count()), std::memory_order_relaxed);
  }

  /// Hands every line to `sink` instead; an empty sink restores the default. For hosts that have a log of
  /// their own. The sink is called on the logging thread and must not log.
  static void setSink(Sink sink);

  /// How to reach the journal with all that is known of a line; a function that may be called from any
  /// thread.
  using Journal = void (*)(LogLevel level, const std::string& line, const std::string& processName,
                           const std::string& facility);
  static void setJournal(Journal journal) noexcept { _journal.store(journal); }
  static Journal journal() noexcept { return _journal.load(); }

  /// From now on, of the lines of one VESK_LOG for one user (LogUser) only the first `lines` in ten seconds
  /// are written, and then one that gives the number of those left out. Level 3 is never limited. 0: no
  /// limit, which is the default.
  static void setRateLimit(std::uint64_t lines);

  /// `site` tells calls apart by its address. `format` lives as long as the process.
  static void write(LogLevel level, const char& site, const char* format, ...) noexcept
      __attribute__((format(printf, 3, 4)));

 private:
  static std::atomic<int> _level;
  static std::atomic<int> _patience;  ///< milliseconds
  static inline std::atomic<Journal> _journal{nullptr};
  static std::chrono::milliseconds patience() noexcept {
    return std::chrono::milliseconds(_patience.load(std::memory_order_relaxed));
  }
};

}  // namespace vesk

/// Evaluates and formats its arguments only when the level is on.
#define VESK_LOG(level, ...)                                     \
  do {                                                           \
    if (::vesk::SystemLog::isOn(level)) {                        \
      static const char veskLogSite = 0;                         \
      ::vesk::SystemLog::write(level, veskLogSite, __VA_ARGS__); \
    }                                                            \
  } while (false)

#define VESK_LOG_ERROR(...) VESK_LOG(::vesk::LogLevel::Error, __VA_ARGS__)
#define VESK_LOG_WARNING(...) VESK_LOG(::vesk::LogLevel::Warning, __VA_ARGS__)
#define VESK_LOG_INFO(...) VESK_LOG(::vesk::LogLevel::Info, __VA_ARGS__)
#define VESK_LOG_DEBUG(...) VESK_LOG(::vesk::LogLevel::Debug, __VA_ARGS__)
