// What a session needs from the daemon.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include <VeskReporting/values/Value.h>
#include "platform/sync/Mutex.h"

namespace vesk {

class ReportingdSession;

/// Implemented by the agent. Outlives the sessions that refer to it. Thread-safe.
class ReportingdSessionDelegate {
 public:
  virtual ~ReportingdSessionDelegate() = default;

  /// The section of the session's storebag that applies to this device, or nullopt. May fetch it, which
  /// blocks for up to the request's timeout while the monitor is held.
  virtual std::optional<Dictionary> storebagForSession(ReportingdSession& session) = 0;
  /// The version of that storebag; never fetches.
  virtual std::optional<std::string> storebagVersionForSession(ReportingdSession& session) = 0;
  /// The identifiers of the session's ancestors, from the top, joined by "."; nullopt if it has none.
  virtual std::optional<std::string> parentSessionIDStringForSession(ReportingdSession& session) = 0;
  /// Moves the session to the family that matches its current user info.
  virtual void userInfoUpdatedForSession(ReportingdSession& session) = 0;
  /// Returns false if the session has no user info or is at the top of its family, and so has no ancestor.
  /// Takes no lock, so that messages of such a session never wait for a storebag.
  virtual bool mayHaveAncestor(ReportingdSession& session) const = 0;
  /// The highest ancestor that aggregates. Call with the monitor held.
  virtual std::shared_ptr<ReportingdSession> getAncestorWithAggregatorForSession(ReportingdSession& session)
      VESK_REQUIRES(monitor()) = 0;
  /// Refreshes the session and those below it in its family.
  virtual void updateDownstreamSessions(ReportingdSession& session) = 0;
  /// Call with the monitor held.
  virtual std::shared_ptr<ReportingdSession> parentSessionForChild(ReportingdSession& session)
      VESK_REQUIRES(monitor()) = 0;

  /// The agent's recursive lock. Lock order: monitor, then a session's mutex, then a backend's.
  virtual RecursiveMutex& monitor() = 0;

  /// For log lines.
  virtual std::string description() const = 0;
};

}  // namespace vesk
