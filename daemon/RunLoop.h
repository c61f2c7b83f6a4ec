// The daemon's main run loop, which waits for a reason to stop.
#pragma once

#include <atomic>
#include <chrono>
#include <functional>
#include <optional>

#include <signal.h>

#include "platform/files/FileDescriptor.h"
#include "platform/service/BusyMarker.h"
#include "platform/service/ServiceManager.h"
#include "platform/sync/Wakeup.h"

namespace vesk {

/// Runs on the main thread for the life of the process, while other threads do the work. Wakes up only for
/// events, for the watchdog's pings, and after work to look for a pause.
class RunLoop {
 public:
  enum class Outcome {
    Stopped,    ///< by `stop`
    Signalled,  ///< by SIGTERM or SIGINT
    Reload,     ///< by `reload` or SIGHUP
    Idle,       ///< no work for the idle time
  };

  struct Options {
    /// How long the process may be idle; nullopt: for ever.
    std::optional<std::chrono::milliseconds> idleExit{};
    /// Called on this thread once work has paused for `pause`, so that no client is delayed, or after ten
    /// times as long without a pause.
    std::function<void()> onPause = nullptr;
    std::chrono::milliseconds pause{3000};
  };

  /// The marker and the service manager must outlive the loop. Blocks SIGTERM, SIGINT and SIGHUP for this
  /// thread and all threads created later, so that `run` receives them, and ignores SIGPIPE. Construct it
  /// before the process has other threads. Throws std::system_error if no descriptor is left.
  RunLoop(Options options, BusyMarker& busyMarker, ServiceManager& serviceManager);
  /// Restores the calling thread's signal mask.
  ~RunLoop();
  RunLoop(const RunLoop&) = delete;
  RunLoop& operator=(const RunLoop&) = delete;

  /// Returns when there is a reason to stop. After a signal, these signals have their default effect again,
  /// so that a second one ends a process that is slow to stop.
  Outcome run();

  /// Makes `run` return, even if called before it. Thread-safe; may be called repeatedly.
  void stop() noexcept { end(Outcome::Stopped); }
  /// The same, with another outcome.
  void reload() noexcept { end(Outcome::Reload); }

 private:
  using Clock = std::chrono::steady_clock;

  void end(Outcome outcome) noexcept;
  void noteBusyMarker(Clock::time_point now);
  void pingWatchdog(Clock::time_point now);
  void lookForPause(Clock::time_point now);
  int pollTimeout(Clock::time_point now) const;

  const Options _options;
  BusyMarker& _busyMarker;
  ServiceManager& _serviceManager;

  FileDescriptor _signals;
  Wakeup _stopRequest;
  std::atomic<Outcome> _requested{Outcome::Stopped};
  sigset_t _previousMask{};

  // Only used by `run`.
  std::optional<Clock::time_point> _idleDeadline;
  std::optional<Clock::time_point> _nextPing;
  std::optional<Clock::time_point> _nextLook;  // next check for a pause in the work
  int _looks = 0;
};

}  // namespace vesk
