// The system log: numeric levels, written to the journal or to stderr.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>

#include "platform/log/LogLevel.h"

namespace vesk {

/// Writes the process's log lines to stderr as "2026-11-24 20:31:29.123 name[pid] <level> text", in UTC. If
/// stderr is connected to the journal, they go there instead: through `setJournal`, or as "<level>text",
/// which the journal understands. Thread-safe, also under other locks; its only lock is the rate limit's,
/// held for a look-up. Doesn't throw or raise SIGPIPE. Control characters in a line appear as \xNN, so that
/// text from outside can't forge a line.
class SystemLog {
 public:
  using Sink = std::function<void(LogLevel, std::string_view line)>;

  /// Names the process and checks whether stderr is the journal. Lines are also written before this and after
  /// `close`, without the name.
  static void open(std::string_view processName, std::string_view facility);
  static void close() noexcept;

  /// Lines with a higher number than `level` are not formatted. Default: 6.
  static void setLevel(int level) noexcept { _level.store(level, std::memory_order_relaxed); }
  static bool isOn(LogLevel level) noexcept {
    return static_cast<int>(level) <= _level.load(std::memory_order_relaxed);
  }

  /// How long a line waits for a slow reader of stderr before it is lost. Default: no wait, and lines are cut
  /// to 4096 bytes, because a library must not block its host. The project's own processes, whose lines
  /// matter to their users, can wait a little.
  static void setPatience(std::chrono::milliseconds patience) noexcept {
    _patience.store(static_cast<int>(patience.count()), std::memory_order_relaxed);
  }

  /// Sends every line to `sink` instead, for hosts with a log of their own. An empty sink restores the
  /// default. The sink is called on the logging thread and must not log.
  static void setSink(Sink sink);

  /// Writes a line to the journal with all its fields. Must be thread-safe.
  using Journal = void (*)(LogLevel level, const std::string& line, const std::string& processName,
                           const std::string& facility);
  static void setJournal(Journal journal) noexcept { _journal.store(journal); }
  static Journal journal() noexcept { return _journal.load(); }

  /// Limits the lines of each VESK_LOG for each user (LogUser) to the first `lines` in ten seconds, followed
  /// by one with the number of lines left out. Level 3 is never limited. 0, the default, means no limit.
  static void setRateLimit(std::uint64_t lines);

  /// The address of `site` identifies the call. `format` must live as long as the process.
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

/// Evaluates and formats its arguments only if the level is on.
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
