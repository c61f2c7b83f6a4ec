#include "client/DaemonLink.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <system_error>
#include <utility>

#include "platform/files/RootPrefix.h"
#include "protocol/WireNames.h"

namespace vesk {

namespace {

// A daemon that accepts but doesn't answer counts as absent.
constexpr std::chrono::seconds kLongestKnock{10};

// A connection that ends sooner counts as a failed attempt, so that a daemon that rejects us is not tried in
// a tight loop.
constexpr std::chrono::seconds kShortestVisit{1};

constexpr std::size_t kLongestCause = 64;  // bytes shown of why there is no connection

constexpr char kTurnedAway[] = "the daemon takes no more";

}  // namespace

DaemonLink::DaemonLink(const ReportingOptions& options, std::shared_ptr<IPCExportedObject> receiver)
    : _socketPath(options.socketPath.empty() ? pathUnderRoot(wire::kSocketPath) : options.socketPath),
      _receiver(std::move(receiver)),
      _policy(options.firstReconnectWait, options.lastReconnectWait),
      _problem(_socketPath + ": not connected") {
  _problem.reserve(_socketPath.size() + 2 + kLongestCause);
}

DaemonLink::Change DaemonLink::reach(Time now, Urgency urgency) {
  if (_bus) return Change::None;
  bool isEarly = now < _policy.due();
  if (isEarly && urgency == Urgency::WhenDue) return Change::None;
  if (isEarly && urgency == Urgency::Early && !_policy.mayTryEarly()) return Change::None;
  if (isEarly) _policy.triedEarly();
  try {
    BusClient::Options options;
    options.socketPath = _socketPath;
    options.objectPath = wire::kObjectPath;
    auto bus = std::make_unique<BusClient>(std::move(options));
    bus->setExportedObject(_receiver);
    _bus = std::move(bus);
    _since = now;
    return Change::None;
  } catch (const std::system_error& error) {
    if (error.code().value() == EUSERS) return lose(now, kTurnedAway, ReportingStatus::TooManyConnections);
    return lose(now, std::strerror(error.code().value()));
  }
}

DaemonLink::Change DaemonLink::process(Time now) {
  if (!_bus) return Change::None;
  if (_bus->process() == BusClient::Progress::Disconnected) {
    if (_bus->wasTurnedAway()) return lose(now, kTurnedAway, ReportingStatus::TooManyConnections);
    return lose(now, _isReady ? "the daemon has closed the connection" : "the daemon does not let us in");
  }
  if (_isReady) return Change::None;
  if (_bus->isReady()) {
    _isReady = _wasEverReady = true;
    _since = now;
    return Change::Ready;
  }
  if (now - _since < kLongestKnock) return Change::None;
  return lose(now, "the daemon does not answer");
}

DaemonLink::Change DaemonLink::lose(Time now, const char* cause, ReportingStatus status) noexcept {
  _problemStatus = status;
  if (_isReady && now - _since >= kShortestVisit) {
    _policy.succeeded();
  } else {
    _policy.failed(now);
  }
  _isReady = false;
  // Has room for every cause, so that losing a connection needs no memory.
  _problem.resize(_socketPath.size() + 2);
  _problem.append(cause, ::strnlen(cause, kLongestCause));
  // Moved out first: handlers called while it ends may query this link.
  auto bus = std::move(_bus);
  return Change::Lost;
}

DaemonLink::Time DaemonLink::nextDue(Time now) const {
  if (!_bus) return _policy.due();
  const int milliseconds = _bus->timeout();
  const Time bus = milliseconds < 0 ? Time::max() : now + std::chrono::milliseconds(milliseconds);
  return _isReady ? bus : std::min(bus, _since + kLongestKnock);
}

}  // namespace vesk
