// Families: sessions of the same client and service, ordered by level.
#include <algorithm>
#include <cinttypes>

#include "daemon/ReportingdAgent.h"
#include "platform/log/SystemLog.h"
#include "platform/unicode/UTF8.h"

namespace vesk {

namespace {

/// Shortens a key for the log, since a client chooses it.
std::string shown(const std::string& key) { return cutToWholeCharacters(key, 256); }

template <class List>
bool contains(const List& list, const ReportingdSession& session) {
  return std::any_of(list.begin(), list.end(), [&](const auto& member) { return member.get() == &session; });
}

}  // namespace

std::shared_ptr<ReportingdSession> ReportingdAgent::getFirstSessionWithHierarchy(std::int64_t level,
                                                                                 const SessionList& list) {
  auto found = std::find_if(list.begin(), list.end(),
                            [&](const auto& session) { return session->getSessionHierarchy() == level; });
  return found == list.end() ? nullptr : *found;
}

const ReportingdAgent::SessionList* ReportingdAgent::correlatedSessions(const std::string& key) const {
  auto list = _correlatedSessions.find(key);
  return list == _correlatedSessions.end() ? nullptr : &list->second;
}

ReportingdAgent::SessionList& ReportingdAgent::listForKey(const std::string& key) {
  if (!correlatedSessions(key)) {
    const bool keepsNone = _correlatedSessions.size() >= kMostKeptLists;
    std::erase_if(_correlatedSessions, [keepsNone](const auto& entry) {
      return entry.second.empty() && (keepsNone || entry.first.size() > kLongestKeptKey);
    });
  }
  SessionList& list = _correlatedSessions[key];
  _familyCount = static_cast<int>(_correlatedSessions.size());
  return list;
}

void ReportingdAgent::userInfoUpdatedForSession(ReportingdSession& session) {
  auto userInfo = session.userInfo();
  if (!userInfo) {
    VESK_LOG_INFO("userInfoUpdatedForSession: No user info found for session %u", session.sessionID());
    removeFromCorrelation(session.shared_from_this());  // a client may withdraw its user info
    return;
  }
  auto self = session.shared_from_this();
  const auto sharedKey = session.correlationKey();
  const std::string& key = *sharedKey;
  RecursiveMutexLock lock(_monitor);
  removeFromCorrelation(self);
  VESK_LOG_DEBUG("userInfoUpdatedForSession: Adding session %u to list for userInfoKey %s",
                 session.sessionID(), shown(key).c_str());
  listForKey(key).push_back(self);
}

std::shared_ptr<ReportingdSession> ReportingdAgent::parentSessionForChild(ReportingdSession& session) {
  std::int32_t level = session.getSessionHierarchy();
  if (level == 0) return nullptr;
  const auto sharedKey = session.correlationKey();
  const std::string& key = *sharedKey;
  VESK_LOG_DEBUG("parentSessionForChild: Checking userInfoKey '%s' for session %u", shown(key).c_str(),
                 session.sessionID());
  const SessionList* list = correlatedSessions(key);
  if (!list || list->empty()) {
    VESK_LOG_ERROR("parentSessionForChild: ERROR: No sessions found for user info key %s",
                   shown(key).c_str());
    return nullptr;
  }
  if (!contains(*list, session)) {
    VESK_LOG_ERROR("parentSessionForChild: ERROR: Session %u not found for user info key %s",
                   session.sessionID(), shown(key).c_str());
    return nullptr;
  }
  const std::int64_t above = std::int64_t{level} - 1;
  auto parent = getFirstSessionWithHierarchy(above, *list);
  if (!parent) {
    VESK_LOG_INFO("parentSessionForChild: Unable to find session with hierarchy of %" PRId64
                  " for userInfoKey '%s'",
                  above, shown(key).c_str());
  }
  return parent;
}

std::optional<std::string> ReportingdAgent::parentSessionIDStringForSession(ReportingdSession& session) {
  std::int32_t level = session.getSessionHierarchy();
  if (level == 0) return std::nullopt;
  const auto sharedKey = session.correlationKey();
  const std::string& key = *sharedKey;
  VESK_LOG_DEBUG("parentSessionIDStringForSession: Checking userInfoKey '%s' for session %u",
                 shown(key).c_str(), session.sessionID());
  RecursiveMutexLock lock(_monitor);
  const SessionList* list = correlatedSessions(key);
  if (!list || list->empty()) {
    VESK_LOG_ERROR("parentSessionIDStringForSession: ERROR: No sessions found for user info key %s",
                   shown(key).c_str());
    return std::nullopt;
  }
  if (!contains(*list, session)) {
    VESK_LOG_ERROR("parentSessionIDStringForSession: ERROR: Session %u not found for user info key %s",
                   session.sessionID(), shown(key).c_str());
    return std::nullopt;
  }
  std::optional<std::string> chain;
  for (std::int32_t above = level; above > 0;) {
    auto ancestor = getFirstSessionWithHierarchy(--above, *list);
    if (!ancestor) {
      VESK_LOG_INFO(
          "parentSessionIDStringForSession: Found a gap in hierarchy (one of parents missing): incomplete "
          "parentSessionID is '%s'",
          chain.value_or("").c_str());
      return chain;
    }
    chain = chain ? ancestor->sessionIDString() + "." + *chain : ancestor->sessionIDString();
  }
  return chain;
}

bool ReportingdAgent::mayHaveAncestor(ReportingdSession& session) const {
  if (!session.userInfo()) {
    VESK_LOG_INFO("getAncestorWithAggregatorForSession: No user info found for session %u",
                  session.sessionID());
    return false;
  }
  return session.getSessionHierarchy() >= 1;
}

std::shared_ptr<ReportingdSession> ReportingdAgent::getAncestorWithAggregatorForSession(
    ReportingdSession& session) {
  if (!mayHaveAncestor(session)) return nullptr;
  const std::int32_t level = session.getSessionHierarchy();
  const SessionList* list = correlatedSessions(*session.correlationKey());
  if (!list) return nullptr;
  // Iterates over the list and not the levels, since a client may choose any number as its level.
  std::shared_ptr<ReportingdSession> ancestor;
  std::int32_t highest = level;
  for (auto candidate = list->begin(); candidate != list->end() && highest > 0; ++candidate) {
    const std::int32_t above = (*candidate)->getSessionHierarchy();
    if (above < 0 || above >= highest || !(*candidate)->hasAggregator()) continue;
    if (getFirstSessionWithHierarchy(above, *list) != *candidate) continue;
    ancestor = *candidate;
    highest = above;
  }
  return ancestor;
}

void ReportingdAgent::updateDownstreamSessions(ReportingdSession& session) {
  if (!session.userInfo()) {
    VESK_LOG_INFO("updateDownstreamSessions: No user info found for session %u", session.sessionID());
    return;
  }
  const auto sharedKey = session.correlationKey();
  const std::string& key = *sharedKey;
  std::int32_t level = session.getSessionHierarchy();
  RecursiveMutexLock lock(_monitor);
  session.updateCombinedSessionID();
  session.syncReportingStates();
  bool aggregationShutDown = false;
  if (level >= 1 && getAncestorWithAggregatorForSession(session)) {
    session.shutdownSessionAggregation();
    aggregationShutDown = true;
  }
  const SessionList* list = correlatedSessions(key);
  if (!list) return;
  for (const auto& below : *list) {
    if (below->getSessionHierarchy() <= level) continue;
    VESK_LOG_DEBUG(
        "updateDownstreamSessions: Updating combined session ID and syncing reporting states for session %u",
        below->sessionID());
    below->updateCombinedSessionID();
    below->syncReportingStates();
    if ((session.hasAggregator() || aggregationShutDown) && below->hasAggregator()) {
      below->shutdownSessionAggregation();
    }
  }
}

}  // namespace vesk
