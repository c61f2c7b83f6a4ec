// The local message log: one file that tells a person at the device what was reported.
#pragma once

#include <span>
#include <string>
#include <string_view>

#include "platform/time/Clock.h"
#include "util/LogFormat.h"

namespace vesk {

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
  void write(std::string_view message) const;

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
