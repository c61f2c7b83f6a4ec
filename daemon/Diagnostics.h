// Answers operators' questions about the running daemon.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <functional>
#include <memory>
#include <optional>

#include <VeskReporting/values/Value.h>
#include "daemon/ReportingdAgent.h"
#include "platform/ipc/IPCConnection.h"
#include "platform/outbox/PostOutbox.h"
#include "storebag/SignedDocument.h"
#include "util/CounterHistory.h"

namespace vesk {

/// Thread-safe. Asking makes no event, session, backend or fetch.
class Diagnostics {
 public:
  /// Everything in it outlives this.
  struct Sources {
    ReportingdAgent& agent;
    const BackendServices& services;
    PostOutbox* outbox;   ///< null: there is none
    Dictionary settings;  ///< in force, as SetupProblems.h has them
    std::function<PublicKeys()> publicKeys;
    const CounterHistory& history;
  };
  /// Reads /etc/group for the group whose members see everything.
  explicit Diagnostics(Sources sources);

  /// Whether the viewer sees all sessions and may use the operations: root, the daemon's user and the group
  /// veskreporting.
  bool seesAll(const IPCPeer& viewer) const;

  /// `health` ("ok" or "degraded") and `reasons`, `version`, `uptime` in seconds, `environment`, `settings`,
  /// `storebags`, `sessions`, `outbox`, `counters`, `total`, `lastPosts` (docs/wire.md). Others than those
  /// who see all get their own sessions, the health and the counters.
  Dictionary status(const IPCPeer& viewer) const;

  /// What the backends of the storebag in force would do for `clientType` and `userInfo` in the
  /// request, `requireUserInfo` (true by default), `draw` (0 by default), `payload` with `category` and
  /// `type`, and `device` (other facts than this device's: `DeviceName`, `RegionCode`,
  /// `diagnosticsSubmission`): `storebag`, `version`, and
  /// `backends` (PostExplanation.h) by name; or `problem`.
  Dictionary explain(const Dictionary& request) const;

  /// Shows the viewer the records that have each value of `filter`, with the wishes `messages` and `bodies`
  /// (true) of that: all, or those of its own sessions, as for `status`. Returns null if too many look.
  std::shared_ptr<DeliveryTap::Reader> openTap(const IPCPeer& viewer, const Dictionary& filter) const;

 private:
  Dictionary lastPosts() const;
  List storebags(List& problems) const;
  List sessions(const IPCPeer& viewer) const;
  Dictionary outboxStatus(List& problems) const;

  const Sources _sources;
  const std::optional<gid_t> _group;
  const std::chrono::steady_clock::time_point _begun = std::chrono::steady_clock::now();
};

}  // namespace vesk
