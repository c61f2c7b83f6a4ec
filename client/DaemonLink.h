// The connection to the daemon, re-established whenever it is lost.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>
#include <poll.h>

#include <chrono>
#include <memory>
#include <string>

#include "client/ReconnectPolicy.h"
#include "platform/ipc/BusClient.h"

namespace vesk {

/// Away (no socket), knocking (connected, but not admitted yet) or ready. Not thread-safe.
class DaemonLink {
 public:
  using Time = ReconnectPolicy::Time;

  enum class Urgency {
    WhenDue,  ///< attempt once the wait between attempts is over
    Early,    ///< attempt also earlier, once per wait
    AtOnce    ///< attempt now
  };
  enum class Change {
    None,
    Ready,  ///< the daemon has admitted us; it knows nothing about us yet
    Lost    ///< no daemon, or connection lost; see `problem`
  };

  /// `receiver` handles the daemon's calls.
  DaemonLink(const ReportingOptions& options, std::shared_ptr<IPCExportedObject> receiver);

  bool isAway() const noexcept { return !_bus; }
  bool isReady() const noexcept { return _isReady; }
  bool wasEverReady() const noexcept { return _wasEverReady; }
  /// A message with the socket's path and the error; empty if there was no memory for it.
  const std::string& problem() const noexcept { return _problem; }
  /// The problem as a status: NotConnected or TooManyConnections.
  ReportingStatus problemStatus() const noexcept { return _problemStatus; }

  /// Call only when ready. After SendResult::Disconnected call `lose`.
  BusClient& bus() noexcept { return *_bus; }

  /// Makes an attempt if the link is away and an attempt is due.
  [[nodiscard]] Change reach(Time now, Urgency urgency);
  /// Reads and writes as far as the socket is ready.
  [[nodiscard]] Change process(Time now);
  /// Closes the connection. Handlers of outstanding answers run before this returns Lost.
  Change lose(Time now, const char* cause, ReportingStatus status = ReportingStatus::NotConnected) noexcept;

  /// For poll(); without a descriptor when away.
  pollfd polled() const { return _bus ? pollfd{_bus->fd(), _bus->events(), 0} : pollfd{-1, 0, 0}; }
  /// When to call `reach` or `process` even if the socket isn't ready.
  Time nextDue(Time now) const;
  /// Whether `Urgency::Early` makes a difference.
  bool mayReachEarly() const noexcept { return !_bus && _policy.mayTryEarly(); }

 private:
  const std::string _socketPath;
  const std::shared_ptr<IPCExportedObject> _receiver;
  ReconnectPolicy _policy;
  std::unique_ptr<BusClient> _bus;
  std::string _problem;
  ReportingStatus _problemStatus = ReportingStatus::NotConnected;
  Time _since{};  ///< start of knocking, then of being ready
  bool _isReady = false;
  bool _wasEverReady = false;
};

}  // namespace vesk
