// The file of the power log, to be written.
#pragma once

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

#include "platform/powerlog/SQLiteHandles.h"
#include "platform/time/Clock.h"

namespace vesk {

/// The log's file, as on a device.
inline constexpr char kPowerLogPath[] = "/var/lib/veskreportingd/power-log.sqlite";

struct PowerLogEvent {
  std::uint32_t identifier = 0;  ///< which kind of event it is registered as
  std::string name;
  WallTime time{};
  std::string dictionary;  ///< JSON object
};

/// An SQLite database (WAL) with one row an event, bounded by age, rows and bytes. A file that is found
/// damaged is moved to "….corrupt" (in place of an earlier one) and begun anew. Used by one thread; waits for
/// the disk, and up to 5 s for another process that writes.
class PowerLogFile {
 public:
  PowerLogFile(std::string path, std::int64_t maximumRows)
      : _path(std::move(path)), _maximumRows(maximumRows) {}

  /// Adds all events or none, and drops those that are beyond the limits. Returns what went wrong; empty when
  /// nothing did.
  [[nodiscard]] std::string append(const std::vector<PowerLogEvent>& events, WallTime now);

 private:
  // These return result codes of SQLite.
  int write(const std::vector<PowerLogEvent>& events, WallTime now);
  int open();
  int insert(const std::vector<PowerLogEvent>& events);
  int prune(WallTime now);

  void moveAside(int damage);

  const std::string _path;
  const std::int64_t _maximumRows;
  SQLiteDatabase _database;  ///< closed after every failure
};

}  // namespace vesk
