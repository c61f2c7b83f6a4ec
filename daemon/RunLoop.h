// The daemon's main run loop: waits for a reason to stop.
#pragma once

#include <chrono>
#include <functional>
#include <optional>

#include <signal.h>

#include "platform/files/FileDescriptor.h"
#include "platform/service/BusyMarker.h"
#include "platform/service/ServiceManager.h"

namespace vesk {

/// Runs on the main thread for the life of the process; the work is done by other threads. It sleeps until
/// something happens: no wake-ups but the watchdog's, and after work those that look for a pause.
class RunLoop {
 public:
  enum class Outcome {
    Stopped,    ///< by `stop`
    Signalled,  ///< by SIGTERM or SIGINT
    Idle,       ///< the busy marker was down for the idle time
  };

  struct Options {
    /// How long the process may be idle; nothing: for ever.
    std::optional<std::chrono::milliseconds> idleExit{};
    /// Called on this thread once work has paused for `pause`, so that it delays no client, or after ten
    /// times as long without a pause.
    std::function<void()> onPause = nullptr;
    std::chrono::milliseconds pause{3000};
  };

  /// Both outlive the loop. From here on SIGTERM and SIGINT wait for `run`, in this thread and in every
  /// thread made later, and SIGPIPE is ignored: construct it before the process has other threads. Throws
  /// std::system_error when there is no descriptor left.
  RunLoop(Options options, BusyMarker& busyMarker, ServiceManager& serviceManager);
  /// Gives the signals back to the calling thread.
  ~RunLoop();
  RunLoop(const RunLoop&) = delete;
  RunLoop& operator=(const RunLoop&) = delete;

  /// Returns when there is a reason to stop. After a signal, SIGTERM and SIGINT have their usual effect
  /// again: a second one ends a process that takes too long to stop.
  Outcome run();

  /// Makes `run` return, also when called before it. Any thread; more than once.
  void stop() noexcept;

 private:
  using Clock = std::chrono::steady_clock;

  void noteBusyMarker(Clock::time_point now);
  void pingWatchdog(Clock::time_point now);
  void lookForPause(Clock::time_point now);
  int pollTimeout(Clock::time_point now) const;

  const Options _options;
  BusyMarker& _busyMarker;
  ServiceManager& _serviceManager;

  FileDescriptor _signals;
  FileDescriptor _stopRequest;
  sigset_t _previousMask{};

  // Used by `run` alone.
  std::optional<Clock::time_point> _idleDeadline;
  std::optional<Clock::time_point> _nextPing;
  std::optional<Clock::time_point> _nextLook;  // whether work has paused
  int _looks = 0;
};

}  // namespace vesk
