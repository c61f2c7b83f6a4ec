#include "daemon/ReportingdAgent.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <algorithm>
#include <cstdio>

#include "platform/log/SystemLog.h"
#include "protocol/ClientSessionStub.h"
#include "util/ReportingdUtil.h"

namespace vesk {

namespace {

std::int32_t clientTypeOf(const ReportingdSession& session) {
  auto info = session.sessionInfo();
  if (!info) return 0;
  return static_cast<std::int32_t>(integerForKey(*info, kVeskReportingSessionInfoClientType).value_or(0));
}

}  // namespace

ReportingdAgent::ReportingdAgent(const SessionServices& services, StorebagFetcher fetchStorebag,
                                 BusyMarker& busyMarker, std::optional<KeptStorebagSource> keptStorebags,
                                 StorebagExpiry hasExpired)
    : _services(services),
      _busyMarker(busyMarker),
      _cachedStorebags(std::move(fetchStorebag), std::move(keptStorebags), services.backends.clock,
                       std::move(hasExpired)) {}

std::string ReportingdAgent::description() const {
  char text[48];
  std::snprintf(text, sizeof text, "<ReportingdAgent: %p>", static_cast<const void*>(this));
  return text;
}

// --- Connections

bool ReportingdAgent::shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) {
  VESK_LOG_DEBUG("listener: Accepting new Orvo connection %s, %d(%d) connections.",
                 connection->description().c_str(), _sessionCount.load(), _familyCount.load());
  auto session = std::make_shared<ReportingdSession>(shared_from_this(), connection, _services);
  IPCHandlers handlers{
      .object = std::make_shared<ClientSessionStub>(session),
      .beforeSending = [session] { session->waitForPosts(); },
      .interruption =
          [session] {
            VESK_LOG_DEBUG("listener: Orvo connection to %s was interrupted", session->description().c_str());
          },
      .invalidation = [session, agent = shared_from_this()] { agent->sessionInvalidated(session); },
      .loss = [&counters = _services.backends.counters](
                  std::size_t calls) { counters.count("session", DropReason::NotAggregated, calls); }};
  if (_makeDiagnostics) handlers.otherObjects[_diagnosticsPath] = _makeDiagnostics(connection->peer());
  // Last, so that no failure leaves behind a session without a connection to end it.
  {
    MutexLock lock(_sessionListMutex);
    _sessionList.push_back(session);
    ++_sessionCount;
    if (_sessionList.size() == 1) _busyMarker.begin();
  }
  connection->resume(std::move(handlers));
  return true;
}

void ReportingdAgent::sessionInvalidated(const std::shared_ptr<ReportingdSession>& session) {
  VESK_LOG_DEBUG("listener: Orvo connection to %s was invalidated", session->description().c_str());
  removeFromSessionList(session);
  removeFromCorrelation(session);
}

std::vector<std::shared_ptr<ReportingdSession>> ReportingdAgent::sessions() {
  MutexLock lock(_sessionListMutex);
  return _sessionList;
}

// The caller holds a reference, so neither erasure destroys the session under a lock.
void ReportingdAgent::removeFromSessionList(const std::shared_ptr<ReportingdSession>& session) {
  MutexLock lock(_sessionListMutex);
  if (std::erase(_sessionList, session) == 0) return;
  --_sessionCount;
  if (_sessionList.empty()) _busyMarker.end();
}

// Searches every list. A client may configure its session again, so the current user info need not match the
// family that the session joined.
void ReportingdAgent::removeFromCorrelation(const std::shared_ptr<ReportingdSession>& session) {
  RecursiveMutexLock lock(_monitor);
  for (auto& [key, list] : _correlatedSessions) std::erase(list, session);
}

// --- Storebags

std::optional<Dictionary> ReportingdAgent::storebagForSession(ReportingdSession& session) {
  std::int32_t clientType = clientTypeOf(session);
  VESK_LOG_DEBUG("storebagForSession: Retrieving storebag for session %u with client type %d",
                 session.sessionID(), clientType);
  RecursiveMutexLock lock(_monitor);
  return _cachedStorebags.storebagForClientType(clientType);
}

std::optional<std::string> ReportingdAgent::storebagVersionForSession(ReportingdSession& session) {
  std::int32_t clientType = clientTypeOf(session);
  RecursiveMutexLock lock(_monitor);
  return _cachedStorebags.versionForClientType(clientType);
}

}  // namespace vesk
