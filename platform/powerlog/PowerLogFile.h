// Writes the file of the power log.
#pragma once

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

#include "platform/result/Result.h"
#include "platform/sqlite/SQLiteHandles.h"
#include "platform/time/Clock.h"

namespace vesk {

/// The default path of the power log.
inline constexpr char kPowerLogPath[] = "/var/lib/veskreportingd/power-log.sqlite";

struct PowerLogEvent {
  std::uint32_t identifier = 0;  ///< the kind of event that it is registered as
  std::string name;
  WallTime time{};
  std::string dictionary;  ///< JSON object
};

/// An SQLite database (WAL) with one row per event, limited by age, rows and bytes. A damaged file is moved
/// to "….corrupt", replacing an earlier one, and started anew. For use by one thread; waits for the disk, and
/// up to 5 s for another process that writes.
class PowerLogFile {
 public:
  PowerLogFile(std::string path, std::int64_t maximumRows)
      : _path(std::move(path)), _maximumRows(maximumRows) {}

  /// Adds all events or none, then drops rows beyond the limits.
  Result<void> append(const std::vector<PowerLogEvent>& events, WallTime now);

 private:
  // These return SQLite result codes.
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
