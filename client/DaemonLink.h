// The connection to the daemon, made again whenever it is lost.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>
#include <poll.h>

#include <chrono>
#include <memory>
#include <string>

#include "client/ReconnectPolicy.h"
#include "platform/ipc/BusClient.h"

namespace vesk {

/// Away (no socket), knocking (connected, not let in yet) or ready. For one thread.
class DaemonLink {
 public:
  using Time = ReconnectPolicy::Time;

  enum class Urgency {
    WhenDue,  ///< attempt when the wait between attempts is over
    Early,    ///< also before, once a wait
    AtOnce    ///< attempt now
  };
  enum class Change {
    None,
    Ready,  ///< the daemon has let us in: it knows nothing about us yet
    Lost    ///< no daemon, or no longer: `problem` says why
  };

  /// `receiver` gets the daemon's calls.
  DaemonLink(const ReportingOptions& options, std::shared_ptr<IPCExportedObject> receiver);

  bool isAway() const noexcept { return !_bus; }
  bool isReady() const noexcept { return _isReady; }
  bool wasEverReady() const noexcept { return _wasEverReady; }
  /// For a person: the socket's path and what is wrong with it; empty when there was no memory for it.
  const std::string& problem() const noexcept { return _problem; }
  /// The same as a status: NotConnected or TooManyConnections.
  ReportingStatus problemStatus() const noexcept { return _problemStatus; }

  /// Only when ready. After SendResult::Disconnected call `lose`.
  BusClient& bus() noexcept { return *_bus; }

  /// Makes an attempt if the link is away and it is time.
  [[nodiscard]] Change reach(Time now, Urgency urgency);
  /// Does what the socket is ready for.
  [[nodiscard]] Change process(Time now);
  /// Gives the connection up. Handlers of answers still owed run before this returns Lost.
  Change lose(Time now, const char* cause, ReportingStatus status = ReportingStatus::NotConnected) noexcept;

  /// For poll(); no descriptor when away.
  pollfd polled() const { return _bus ? pollfd{_bus->fd(), _bus->events(), 0} : pollfd{-1, 0, 0}; }
  /// When `reach` or `process` has to be called without the socket being ready.
  Time nextDue(Time now) const;
  /// Whether `Urgency::Early` would make a difference.
  bool mayReachEarly() const noexcept { return !_bus && _policy.mayTryEarly(); }

 private:
  const std::string _socketPath;
  const std::shared_ptr<IPCExportedObject> _receiver;
  ReconnectPolicy _policy;
  std::unique_ptr<BusClient> _bus;
  std::string _problem;
  ReportingStatus _problemStatus = ReportingStatus::NotConnected;
  Time _since{};  ///< of knocking, then of being ready
  bool _isReady = false;
  bool _wasEverReady = false;
};

}  // namespace vesk
