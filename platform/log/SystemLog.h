// The system log: numeric levels, to the journal or to stderr.
#pragma once

#include <atomic>
#include <chrono>
#include <functional>
#include <string_view>

namespace vesk {

/// Levels are the syslog priorities of the same numbers.
enum class LogLevel : int { Error = 3, Warning = 4, Info = 6, Debug = 7 };

/// Writes the process's log lines. Lines go to the journal when stderr is connected to it, else to stderr as
/// "2026-11-24 20:31:29.123 name[pid] <level> text", in UTC. Safe from any thread; takes no lock of the
/// project's own; never throws, raises no SIGPIPE. Control characters in a line are shown as \xNN, so that
/// text from outside can't forge a line.
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

  static void write(LogLevel level, const char* format, ...) noexcept __attribute__((format(printf, 2, 3)));

 private:
  static std::atomic<int> _level;
  static std::atomic<int> _patience;  ///< milliseconds
};

}  // namespace vesk

/// Evaluates and formats its arguments only when the level is on.
#define VESK_LOG(level, ...)                                                          \
  do {                                                                                \
    if (::vesk::SystemLog::isOn(level)) ::vesk::SystemLog::write(level, __VA_ARGS__); \
  } while (false)

#define VESK_LOG_ERROR(...) VESK_LOG(::vesk::LogLevel::Error, __VA_ARGS__)
#define VESK_LOG_WARNING(...) VESK_LOG(::vesk::LogLevel::Warning, __VA_ARGS__)
#define VESK_LOG_INFO(...) VESK_LOG(::vesk::LogLevel::Info, __VA_ARGS__)
#define VESK_LOG_DEBUG(...) VESK_LOG(::vesk::LogLevel::Debug, __VA_ARGS__)
