// The connections of one listener: how many there are, and their threads. Private to platform/ipc.
#pragma once

#include <sys/types.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <vector>

#include "platform/ipc/SmallThread.h"
#include "platform/ipc/Wakeup.h"
#include "platform/sync/Mutex.h"

namespace vesk {

class BusConnection;

/// Shared by the listener and its connections, of which some may outlive it. Thread-safe. A connection counts
/// from `admit` until its thread has let it go, or until it is released when it never had one. The last few
/// of `maximum` are kept for root, so that an operator gets in when others have used up the rest.
class ConnectionRegistry {
 public:
  ConnectionRegistry(std::size_t maximum, std::size_t maximumPerUser)
      : _maximum(maximum),
        _maximumOfOthers(maximum - std::min(kKeptForRoot, maximum / 8)),
        _maximumPerUser(maximumPerUser) {}

  enum class Admission { Admitted, TooMany, TooManyOfUser };
  [[nodiscard]] Admission admit(uid_t user);
  void release(uid_t user) noexcept;
  std::size_t count() const;

  /// Makes an admitted connection known to `connections`.
  void add(std::uint64_t serial, std::weak_ptr<BusConnection> connection);
  void remove(std::uint64_t serial) noexcept;
  std::vector<std::shared_ptr<BusConnection>> connections() const;

  /// Runs `body` on a thread of its own. Throws std::system_error.
  void launch(std::function<void()> body);
  /// Joins threads that have ended. The listener calls it when `threadEnded` is readable.
  void reap();
  /// Waits until every thread has ended, at most until `deadline`, and joins those that have. False when some
  /// still run.
  bool waitForThreads(std::chrono::steady_clock::time_point deadline);
  const Wakeup& threadEnded() const noexcept { return _threadEnded; }

 private:
  void finish(std::uint64_t thread) noexcept;

  static constexpr std::size_t kKeptForRoot = 16;

  const std::size_t _maximum;
  const std::size_t _maximumOfOthers;
  const std::size_t _maximumPerUser;
  Wakeup _threadEnded;

  mutable Mutex _mutex;
  std::condition_variable_any _noneRuns;
  std::size_t _count VESK_GUARDED_BY(_mutex) = 0;
  std::map<uid_t, std::size_t> _countOfUser VESK_GUARDED_BY(_mutex);
  std::map<std::uint64_t, std::weak_ptr<BusConnection>> _connections VESK_GUARDED_BY(_mutex);
  std::uint64_t _lastThread VESK_GUARDED_BY(_mutex) = 0;
  std::map<std::uint64_t, SmallThread> _running VESK_GUARDED_BY(_mutex);
  std::map<std::uint64_t, SmallThread> _ended VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
