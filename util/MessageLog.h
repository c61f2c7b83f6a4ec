// The local message log: one file that tells a person at the device what was reported.
#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <variant>

#include "platform/time/Clock.h"
#include "platform/values/Text.h"

namespace vesk {

/// One value for a placeholder of a log format. It remembers its own type, so a format that does not fit it
/// still prints the value.
class LogArgument {
 public:
  LogArgument(std::string_view text) noexcept : _value(text) {}                                 // NOLINT
  LogArgument(const std::string& text) noexcept : _value(std::string_view(text)) {}             // NOLINT
  LogArgument(const char* text) noexcept : _value(std::string_view(text ? text : "(null)")) {}  // NOLINT
  LogArgument(const Text& text) noexcept : _value(text.view()) {}                               // NOLINT
  LogArgument(double number) noexcept : _value(number) {}                                       // NOLINT
  LogArgument(bool value) noexcept : _value(static_cast<std::int64_t>(value)) {}                // NOLINT
  template <class Integer, std::enable_if_t<std::is_integral_v<Integer>, int> = 0>
  LogArgument(Integer number) noexcept {  // NOLINT
    if constexpr (std::is_signed_v<Integer>) {
      _value = static_cast<std::int64_t>(number);
    } else {
      _value = static_cast<std::uint64_t>(number);
    }
  }
  /// What is none prints "(null)".
  template <class T>
  LogArgument(const std::optional<T>& value) noexcept  // NOLINT
      : LogArgument(value ? LogArgument(*value) : LogArgument(std::string_view("(null)"))) {}

  const std::variant<std::string_view, std::int64_t, std::uint64_t, double>& value() const noexcept {
    return _value;
  }

 private:
  std::variant<std::string_view, std::int64_t, std::uint64_t, double> _value;
};

/// Fills the placeholders of `format`: "%@" and "%s" show any value in its plain form; "%d", "%i", "%u",
/// "%x",
/// "%X", "%o", "%c", "%f", "%e", "%g" with flags, width and precision show numbers as printf does (length
/// modifiers are skipped, since the value knows its own size) and a text as it is; "%%" is a percent sign. A
/// placeholder without a value stays as it stands; values without a placeholder are left out.
std::string formatLogMessage(std::string_view format, std::span<const LogArgument> arguments);

/// Appends lines to the one log file of a directory, starts a new file each day and deletes the old one. All
/// state is in the directory. Failures cost a system-log line, never an exception. Thread-safe: a whole write
/// happens under one lock of the process, a leaf under which only the system log is called, so two sessions'
/// lines are never mixed or lost.
///
/// The directory's own parents may be links, as the administrator likes; a log file may not. Files are made
/// with mode 0640 and directories with mode 0750. A file's creation date is its birth time where the file
/// system records one, else the time of its last change; with neither it is unknown.
class MessageLog {
 public:
  /// `directory`: as it is on disk. `clock` must outlive the log.
  MessageLog(std::string directory, const WallClock& clock);

  /// Writes one line: "(date) message".
  void write(std::string_view message);

 private:
  const std::string _directory;
  const WallClock& _clock;
};

/// A wall time as the log shows it, in UTC: "2026-11-24 20:31:29 +0000".
std::string logDate(WallTime time);

/// Appends to the process's message log, in /var/mobile/Library/Logs/Dunmore/Retired under the root prefix.
void writeToLogFile(std::string_view format, std::span<const LogArgument> arguments);

template <class... Values>
void writeToLogFile(std::string_view format, const Values&... values) {
  const LogArgument arguments[] = {LogArgument(values)..., LogArgument(0)};
  writeToLogFile(format, std::span<const LogArgument>(arguments, sizeof...(values)));
}

}  // namespace vesk
