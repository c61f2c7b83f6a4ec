// Counts a listener's connections and manages their threads. Private to platform/ipc.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <vector>

#include "platform/ipc/IPCListener.h"
#include "platform/sync/Mutex.h"

namespace vesk {

class BusConnection;

/// Shared by the listener, its connections and their threads, some of which may outlive the listener.
/// Thread-safe. A connection counts from `admit` until `release`. The last few of the maximum are reserved
/// for root, so that an operator gets in when others have used up the rest.
class ConnectionRegistry : public std::enable_shared_from_this<ConnectionRegistry> {
 public:
  explicit ConnectionRegistry(IPCListener::Options given) : options(std::move(given)) {}

  const IPCListener::Options options;

  enum class Admission { Admitted, TooMany, TooManyOfUser };
  [[nodiscard]] Admission admit(std::uint64_t serial, uid_t user);
  void release(std::uint64_t serial) noexcept;
  std::size_t count() const;

  /// Includes an admitted connection in `connections`.
  void add(std::uint64_t serial, std::weak_ptr<BusConnection> connection);
  std::vector<std::shared_ptr<BusConnection>> connections() const;

  /// Runs `body`, which must not throw, on a thread of its own. Throws std::system_error.
  void launch(std::function<void()> body);
  /// Waits until every `body` has returned and was destroyed, at most until `deadline`. Returns false if some
  /// are still running.
  bool waitForThreads(std::chrono::steady_clock::time_point deadline);

 private:
  struct Entry {
    uid_t user;
    std::weak_ptr<BusConnection> connection;
  };

  void finish() noexcept;

  mutable Mutex _mutex;
  std::condition_variable_any _noneRuns;
  std::map<std::uint64_t, Entry> _entries VESK_GUARDED_BY(_mutex);
  std::size_t _running VESK_GUARDED_BY(_mutex) = 0;
};

}  // namespace vesk
