// Keeps the counters over restarts.
#pragma once

#include <string>
#include <utility>
#include <vector>

#include "platform/sync/Mutex.h"
#include "util/Counters.h"

namespace vesk {

/// The counts of earlier runs, in a file, and those of this run. A process that is killed loses what it
/// counted after the last `save`. Thread-safe.
class CounterHistory {
 public:
  /// Reads the file at `path`, without adding the root prefix. `counters` must outlive this.
  CounterHistory(std::string path, const Counters& counters);

  /// Writes the file if anything was counted since the last time. Waits for the disk. A failure is logged
  /// once.
  void save();

  /// Since the installation, ordered by backend name and reason.
  std::vector<Counters::Count> total() const;

 private:
  const std::string _path;
  const Counters& _counters;
  const std::vector<Counters::Count> _earlier;
  Mutex _mutex;
  std::string _saved VESK_GUARDED_BY(_mutex);
  bool _hasFailed VESK_GUARDED_BY(_mutex) = false;
};

}  // namespace vesk
