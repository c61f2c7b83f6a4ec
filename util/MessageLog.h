// The local message log: one file that tells a person at the device what was reported.
#pragma once

#include <sys/stat.h>

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/WarningBurst.h"
#include "platform/time/Clock.h"
#include "util/Counters.h"
#include "util/LogFormat.h"

namespace vesk {

/// A log file as its directory shows it.
struct MessageLogFile {
  std::string path;
  std::optional<WallTime> created;
};

/// Appends lines to the one log file of a directory, starts a new file each day and deletes the old one.
/// Failures cost a system-log line, never an exception; every line that is lost is counted. Thread-safe: a
/// whole write happens under one lock of the process, a leaf under which only the system log is called, so
/// two sessions' lines are never mixed or lost.
///
/// The directory decides, not memory: a file that was removed, replaced or joined by a second one is seen by
/// the next write. The file only stays open from one write to the next while the directory, by its identity
/// and times, is the one in which a search found no other log file. A directory that changed less than 100 ms
/// before the search is searched again, because a second change could leave the same time in it.
///
/// The directory's own parents may be links, as the administrator likes; a log file may not. Files are made
/// with mode 0640 and directories with mode 0750.
class MessageLog {
 public:
  struct Options {
    std::int64_t maximumBytes = std::int64_t{64} << 20;  ///< of a file; clients decide how much is written
    Counters* counters = &Counters::shared();
  };

  /// `directory`: as it is on disk. `clock` and the counters must outlive the log.
  MessageLog(std::string directory, const WallClock& clock, const Options& options);
  MessageLog(std::string directory, const WallClock& clock)
      : MessageLog(std::move(directory), clock, Options()) {}

  /// Writes one line: "(date) message". One for which the file has no room is dropped and counted.
  void write(std::string_view message);

 private:
  struct Current {
    std::optional<MessageLogFile> file;  ///< none: it could not be made
    FileDescriptor descriptor;
    struct stat directory {};  ///< from before it was searched
    bool canStay = false;      ///< it is the directory's only log file, and a change of that will show
  };

  Current search(WallTime now) const;
  bool isStillChosen(const Current& current, WallTime now) const;
  void countLost() const noexcept;

  const std::string _directory;
  const WallClock& _clock;
  const Options _options;
  // Used under the lock.
  Current _current;
  WarningBurst _full;
};

/// When the log file of that name was made: its birth time where the file system records one, else the
/// seconds in its name, which no line that is added moves. With neither it is the time of its last change.
std::optional<WallTime> logFileCreationDate(const struct statx& status, std::string_view name);

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
