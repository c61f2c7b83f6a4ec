// The daemon's object graph, built in one place.
#pragma once

#include <chrono>
#include <memory>

#include "daemon/DaemonOptions.h"
#include "platform/service/BusyMarker.h"
#include "platform/service/ServiceManager.h"

namespace vesk {

/// Everything that serves clients: HTTP client, agent, listener. Members are destroyed from the clients
/// inwards.
class Daemon {
 public:
  /// Publishes nothing yet. Throws std::system_error when the socket can't be made.
  Daemon(ServiceManager& serviceManager, BusyMarker& busyMarker);
  /// As `stop`, but for sessions that do not end: those are waited for.
  ~Daemon();

  /// Begins to accept clients.
  void resume();

  /// Ends in order: no new connections, the sessions destroyed (they send their closing messages and flush),
  /// then what is being posted waited for, at most `kPostWait`, and datagrams, at most `kDatagramWait`; what
  /// is left is given up. Last, one line for each reason and backend says what was lost since the start. Safe
  /// to call twice.
  ///
  /// False when a session did not end within `kSessionWait`, as happens when the disk under it hangs: then
  /// nothing was destroyed, and the process has to be left by std::_Exit.
  [[nodiscard]] bool stop();

  static constexpr std::chrono::seconds kSessionWait{15};
  static constexpr std::chrono::seconds kPostWait{10};
  /// From the same moment: a dashboard that is not answered gives up 9.5 s after its next tick.
  static constexpr std::chrono::milliseconds kDatagramWait{10'500};

 private:
  struct Parts;
  std::unique_ptr<Parts> _parts;
  bool _stopped = false;
};

}  // namespace vesk
