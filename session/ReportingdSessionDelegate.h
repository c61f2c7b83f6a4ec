// What a session asks of the daemon.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include <VeskReporting/values/Value.h>
#include "platform/sync/Mutex.h"

namespace vesk {

class ReportingdSession;

/// Implemented by the agent; outlives every session that holds it. May be called from any thread.
class ReportingdSessionDelegate {
 public:
  virtual ~ReportingdSessionDelegate() = default;

  /// The section of the session's storebag that applies to this device, or nothing. May fetch, and then
  /// blocks for up to the request's timeout with the monitor held.
  virtual std::optional<Dictionary> storebagForSession(ReportingdSession& session) = 0;
  /// The version of that storebag; never fetches.
  virtual std::optional<std::string> storebagVersionForSession(ReportingdSession& session) = 0;
  /// The identities of the session's ancestors, from the top, joined by "."; nothing when there are none.
  virtual std::optional<std::string> parentSessionIDStringForSession(ReportingdSession& session) = 0;
  /// Groups the session anew by its current user info.
  virtual void userInfoUpdatedForSession(ReportingdSession& session) = 0;
  /// False when the session has no user info or is at the top of its family: then it has no ancestor. Takes
  /// no lock, so that a message of such a session never waits for a storebag.
  virtual bool mayHaveAncestor(ReportingdSession& session) const = 0;
  /// The highest ancestor that aggregates. The caller holds the monitor.
  virtual std::shared_ptr<ReportingdSession> getAncestorWithAggregatorForSession(ReportingdSession& session)
      VESK_REQUIRES(monitor()) = 0;
  /// Refreshes the session and those below it in its group.
  virtual void updateDownstreamSessions(ReportingdSession& session) = 0;
  /// The caller holds the monitor.
  virtual std::shared_ptr<ReportingdSession> parentSessionForChild(ReportingdSession& session)
      VESK_REQUIRES(monitor()) = 0;

  /// The agent's own lock, recursive: first in the order of locks (monitor, then a session's, then a
  /// backend's).
  virtual RecursiveMutex& monitor() = 0;

  /// For log lines.
  virtual std::string description() const = 0;
};

}  // namespace vesk
