// The local message log: a file that shows people at the device what was reported.
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

/// A log file as found in its directory.
struct MessageLogFile {
  std::string path;
  std::optional<WallTime> created;
};

/// Appends lines to the single log file of a directory. Starts a new file each day and deletes the old one.
/// Failures cause a system-log line, never an exception; every lost line is counted. Thread-safe: each write
/// holds one process-wide lock, under which only the system log is called, so lines of different sessions are
/// never mixed or lost.
///
/// The directory is authoritative: a write notices if the file was removed, replaced or joined by another.
/// The file stays open between writes only while the directory's identity and times show that it has not
/// changed since a search found no other log file. A directory that changed less than 100 ms before the
/// search is searched again, because a second change could leave the same time.
///
/// The directory's parents may be symbolic links; a log file may not. Files are created with mode 0640 and
/// directories with mode 0750.
class MessageLog {
 public:
  struct Options {
    std::int64_t maximumBytes = std::int64_t{64} << 20;  ///< of the file; clients decide how much is written
    Counters* counters = &Counters::shared();
  };

  /// `directory`: used as it is; no root prefix is added. `clock` and the counters must outlive the log.
  MessageLog(std::string directory, const WallClock& clock, const Options& options);
  MessageLog(std::string directory, const WallClock& clock)
      : MessageLog(std::move(directory), clock, Options()) {}

  /// Writes one line: "(date) message". Drops and counts the line if the file is full.
  void write(std::string_view message);

 private:
  struct Current {
    std::optional<MessageLogFile> file;  ///< nullopt: it could not be created
    FileDescriptor descriptor;
    struct stat directory {};  ///< its state before the search
    bool canStay = false;      ///< it is the directory's only log file, and a change will be noticed
  };

  Current search(WallTime now) const;
  bool isStillChosen(const Current& current, WallTime now) const;
  void countLost() const noexcept;

  const std::string _directory;
  const WallClock& _clock;
  const Options _options;
  // Only used under the lock.
  Current _current;
  WarningBurst _full;
};

/// Formats a time for the log, in UTC: "2026-11-24 20:31:29 +0000".
std::string logDate(WallTime time);

/// Appends to the process's message log, in /var/mobile/Library/Logs/Dunmore/Retired below the root prefix.
void writeToLogFile(std::string_view format, std::span<const LogArgument> arguments);

template <class... Values>
void writeToLogFile(std::string_view format, const Values&... values) {
  const LogArgument arguments[] = {LogArgument(values)..., LogArgument(0)};
  writeToLogFile(format, std::span<const LogArgument>(arguments, sizeof...(values)));
}

}  // namespace vesk
