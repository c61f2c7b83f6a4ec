// The file of the power log, to be written.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <string>
#include <vector>

#include "platform/files/FileDescriptor.h"
#include "platform/powerlog/PowerLogEvent.h"
#include "platform/powerlog/SQLiteHandles.h"

namespace vesk {

/// An SQLite database (WAL) with one row an event. Several processes may write to it at the same time. One
/// that is found damaged is moved to "….corrupt" (in place of an earlier one) and begun anew. Used by one
/// thread; waits for a disk as long as that takes, for other processes only as long as its bounds say.
class PowerLogStore {
 public:
  struct Bounds {
    std::chrono::seconds age = std::chrono::days(7);
    std::int64_t rows = 100'000;
    std::int64_t bytes = std::int64_t{64} << 20;                   ///< of the database, roughly
    std::chrono::milliseconds patience = std::chrono::seconds(5);  ///< with another process, each time
  };

  PowerLogStore(std::string path, const Bounds& bounds) : _path(std::move(path)), _bounds(bounds) {}

  /// Adds all events or none, and drops what is beyond the bounds. What went wrong comes back as text; empty:
  /// nothing did.
  [[nodiscard]] std::string append(const std::vector<PowerLogEvent>& events, WallTime now);

 private:
  /// Which file a path names.
  struct Identity {
    dev_t device = 0;
    ino_t inode = 0;
    friend bool operator==(const Identity&, const Identity&) = default;
  };

  int openAndWrite(const std::vector<PowerLogEvent>& events, WallTime now);
  int open();
  int write(const std::vector<PowerLogEvent>& events, WallTime now);
  int insert(const std::vector<PowerLogEvent>& events);
  int prune(WallTime now);
  int remove(const char* statement, std::int64_t bound);
  std::int64_t pragma(const char* name);
  /// Why it could not; empty: it is out of the way.
  std::string setAside();
  /// Other processes neither set up the file nor put it aside while `lock` is held. False when another one
  /// holds it for too long.
  [[nodiscard]] bool lockOthersOut(FileDescriptor& lock) const;
  Identity fileAtPath() const;

  const std::string _path;
  const Bounds _bounds;
  SQLiteDatabase _database;
  Identity _opened;
};

}  // namespace vesk
