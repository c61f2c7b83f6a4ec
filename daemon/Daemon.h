// The daemon's object graph, built in one place.
#pragma once

#include <chrono>
#include <functional>
#include <memory>

#include "daemon/DaemonOptions.h"
#include "platform/service/BusyMarker.h"
#include "platform/service/ServiceManager.h"

namespace vesk {

/// Everything that serves clients: HTTP client, agent, listener. Destroyed in order from the clients inwards.
class Daemon {
 public:
  /// Does not accept clients yet. Throws std::system_error if the socket can't be created.
  /// `reload`, on any thread, asks the process to end so that it is started anew; it must outlive this.
  Daemon(
      ServiceManager& serviceManager, BusyMarker& busyMarker, std::function<void()> reload = [] {});
  /// Like `stop`, but waits for all sessions without a limit.
  ~Daemon();

  /// Starts accepting clients.
  void resume();

  /// Writes what was counted to disk, and tells the service manager how things stand. Called now and then.
  void takeStock();

  /// Stops in order: closes the listener, destroys the sessions (they send their closing messages and flush),
  /// then waits for posts in progress, at most `kPostWait`, and for datagrams, at most `kDatagramWait`.
  /// Abandons what is left, then logs the losses since the start, one line for each reason and backend. Safe
  /// to call twice.
  ///
  /// Returns false if a session did not end within `kSessionWait`, for example because its disk hangs.
  /// Nothing has been destroyed then, and the process must exit with std::_Exit.
  [[nodiscard]] bool stop();

  static constexpr std::chrono::seconds kSessionWait{15};
  static constexpr std::chrono::seconds kPostWait{10};
  /// Counted from the same moment as `kPostWait`. An unanswered dashboard fails 9.5 s after its next tick.
  static constexpr std::chrono::milliseconds kDatagramWait{10'500};

 private:
  struct Parts;
  std::unique_ptr<Parts> _parts;
  bool _stopped = false;
};

}  // namespace vesk
