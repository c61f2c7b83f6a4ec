// Accepts clients, keeps their sessions, and serves as the sessions' delegate.
#pragma once

#include <atomic>
#include <cstddef>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "daemon/StorebagCache.h"
#include "platform/ipc/IPCListener.h"
#include "platform/service/BusyMarker.h"
#include "platform/sync/Mutex.h"
#include "session/ReportingdSession.h"
#include "session/ReportingdSessionDelegate.h"

namespace vesk {

/// Keeps the list of live sessions under a lock of its own, and the storebag cache and the families of
/// sessions under a recursive lock, the monitor. The two locks are never nested. A session's last reference
/// is never dropped under either of them.
///
/// Its sessions share ownership, so it outlives them. Sources: ReportingdAgent.cpp (connections, storebags),
/// ReportingdAgentHierarchy.cpp (families).
class ReportingdAgent final : public ReportingdSessionDelegate,
                              public IPCListenerDelegate,
                              public std::enable_shared_from_this<ReportingdAgent> {
 public:
  /// `services` and `busyMarker` must outlive the agent.
  ReportingdAgent(const SessionServices& services, StorebagFetcher fetchStorebag, BusyMarker& busyMarker,
                  std::optional<KeptStorebagSource> keptStorebags = std::nullopt,
                  StorebagExpiry hasExpired = {});

  /// Makes a connection's second object, exported under `path`. Call before connections are accepted.
  using ObjectMaker = std::function<std::shared_ptr<IPCExportedObject>(const IPCPeer& peer)>;
  void setDiagnostics(std::string path, ObjectMaker make) {
    _diagnosticsPath = std::move(path);
    _makeDiagnostics = std::move(make);
  }

  /// For operators; thread-safe. The caller may end up as a session's last holder.
  std::vector<std::shared_ptr<ReportingdSession>> sessions();
  std::vector<StorebagStatus> storebagStatus() const VESK_NO_THREAD_SAFETY_ANALYSIS {
    return _cachedStorebags.status();
  }

  // --- IPCListenerDelegate
  bool shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) override;
  /// Called when a session's connection has ended. Removes the session from the list and from every family.
  /// The caller must hold a reference, so that the session is not destroyed under a lock.
  void sessionInvalidated(const std::shared_ptr<ReportingdSession>& session);

  // --- ReportingdSessionDelegate
  std::optional<Dictionary> storebagForSession(ReportingdSession& session) override;
  std::optional<std::string> storebagVersionForSession(ReportingdSession& session) override;
  std::optional<std::string> parentSessionIDStringForSession(ReportingdSession& session) override;
  void userInfoUpdatedForSession(ReportingdSession& session) override;
  bool mayHaveAncestor(ReportingdSession& session) const override;
  std::shared_ptr<ReportingdSession> getAncestorWithAggregatorForSession(ReportingdSession& session) override
      VESK_REQUIRES(_monitor);
  void updateDownstreamSessions(ReportingdSession& session) override;
  std::shared_ptr<ReportingdSession> parentSessionForChild(ReportingdSession& session) override
      VESK_REQUIRES(_monitor);
  RecursiveMutex& monitor() override VESK_RETURNS_CAPABILITY(_monitor) { return _monitor; }
  std::string description() const override;

 private:
  using SessionList = std::vector<std::shared_ptr<ReportingdSession>>;

  /// Empty lists are kept in case their family returns. At this many lists, the empty ones are removed before
  /// another is added, so that clients can't fill the memory with invented names.
  static constexpr std::size_t kMostKeptLists = 256;
  /// An empty list whose key exceeds this size in bytes is removed when the next list is added.
  static constexpr std::size_t kLongestKeptKey = 1024;

  void removeFromSessionList(const std::shared_ptr<ReportingdSession>& session) VESK_EXCLUDES(_monitor);
  void removeFromCorrelation(const std::shared_ptr<ReportingdSession>& session)
      VESK_EXCLUDES(_sessionListMutex);

  /// The first session with exactly that level, in the order of joining.
  static std::shared_ptr<ReportingdSession> getFirstSessionWithHierarchy(std::int64_t level,
                                                                         const SessionList& list);
  const SessionList* correlatedSessions(const std::string& key) const VESK_REQUIRES(_monitor);
  SessionList& listForKey(const std::string& key) VESK_REQUIRES(_monitor);

  // Written under the lock of what they count, and read without it, because a listener's log line must not
  // wait for a storebag.
  std::atomic<int> _sessionCount{0};
  std::atomic<int> _familyCount{0};

  // Constant once connections are accepted.
  std::string _diagnosticsPath;
  ObjectMaker _makeDiagnostics;

  // Constant after construction.
  const SessionServices& _services;
  BusyMarker& _busyMarker;

  // Guarded by _sessionListMutex: accepted sessions that are not invalidated yet, in order of acceptance.
  Mutex _sessionListMutex;
  SessionList _sessionList VESK_GUARDED_BY(_sessionListMutex);

  // Guarded by _monitor.
  RecursiveMutex _monitor;
  StorebagCache _cachedStorebags VESK_GUARDED_BY(_monitor);
  std::map<std::string, SessionList> _correlatedSessions VESK_GUARDED_BY(_monitor);
};

}  // namespace vesk
