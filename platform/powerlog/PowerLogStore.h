// The file of the power log, to be written.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <map>
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

  struct Moment {
    WallTime wall;
    std::chrono::seconds uptime{0};  ///< of the machine, asleep or not; nobody sets it
  };

  PowerLogStore(std::string path, const Bounds& bounds) : _path(std::move(path)), _bounds(bounds) {}

  /// Adds all events or none, and drops what is beyond the bounds. What went wrong comes back as text; empty:
  /// nothing did.
  [[nodiscard]] std::string append(const std::vector<PowerLogEvent>& events, const Moment& now);

 private:
  /// Which file a path names.
  struct Identity {
    dev_t device = 0;
    ino_t inode = 0;
    friend bool operator==(const Identity&, const Identity&) = default;
  };

  int openAndWrite(const std::vector<PowerLogEvent>& events, const Moment& now);
  int open();
  int check();
  int write(const std::vector<PowerLogEvent>& events, const Moment& now);
  int insert(const std::vector<PowerLogEvent>& events);
  int prune(const Moment& now);
  int dropAged(const Moment& now);
  int remove(const char* statement, std::int64_t bound);
  std::int64_t number(const char* statement);
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
  Identity _checked;        ///< found whole; of this file the following is known
  std::int64_t _found = 0;  ///< the last row that was there then: up to it, rows age by the wall clock
  /// The last row at the end of each hour of uptime since. These rows age by the uptime: a device that starts
  /// with a wrong time and then learns the right one must not lose what it has just recorded.
  std::map<std::chrono::hours, std::int64_t> _added;
};

}  // namespace vesk
