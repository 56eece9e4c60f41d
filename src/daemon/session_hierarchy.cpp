// The agent's hierarchy: parents, ancestors that aggregate, and the refreshing of a chain.
#include "daemon/correlated_list.h"
#include "daemon/user_info_key.h"
#include "daemon/veltrad_agent.h"
#include "platform/log.h"

namespace veltrad {

const CorrelatedList* VeltradAgent::correlatedList(const VeltradSession& session) const {
  const auto at = _correlatedSessions.find(userInfoKeyForUserInfo(session.userInfo().get()));
  return at == _correlatedSessions.end() ? nullptr : &at->second;
}

std::optional<std::string> VeltradAgent::parentSessionIDStringForSession(const VeltradSession& session) {
  const std::int32_t hierarchy = session.getSessionHierarchy();
  if (hierarchy == 0) return std::nullopt;
  const std::string key = userInfoKeyForUserInfo(session.userInfo().get());
  logDebug("parentSessionIDStringForSession: Checking userInfoKey '%s' for session %u", key.c_str(),
           session.sessionID());
  const Lock held(_lock);
  const CorrelatedList* list = correlatedList(session);
  if (!list || list->empty()) {
    logError("parentSessionIDStringForSession: ERROR: No sessions found for user info key %s", key.c_str());
    return std::nullopt;
  }
  if (!contains(*list, session)) {
    logError("parentSessionIDStringForSession: ERROR: Session %u not found for user info key %s",
             session.sessionID(), key.c_str());
    return std::nullopt;
  }
  if (hierarchy < 0) return std::nullopt;
  AncestorIDs ids = ancestorIDs(hierarchy, *list);
  if (!ids.complete) {
    logInfo(
        "parentSessionIDStringForSession: Found a gap in hierarchy (one of parents missing): incomplete "
        "parentSessionID is '%s'",
        ids.text.c_str());
  }
  if (ids.text.empty()) return std::nullopt;
  return std::move(ids.text);
}

std::shared_ptr<VeltradSession> VeltradAgent::parentSessionForChild(const VeltradSession& session) {
  const std::int32_t hierarchy = session.getSessionHierarchy();
  if (hierarchy == 0) return nullptr;
  const std::string key = userInfoKeyForUserInfo(session.userInfo().get());
  logDebug("parentSessionForChild: Checking userInfoKey '%s' for session %u", key.c_str(),
           session.sessionID());
  const Lock held(_lock);
  const CorrelatedList* list = correlatedList(session);
  if (!list || list->empty()) {
    logError("parentSessionForChild: ERROR: No sessions found for user info key %s", key.c_str());
    return nullptr;
  }
  if (!contains(*list, session)) {
    logError("parentSessionForChild: ERROR: Session %u not found for user info key %s", session.sessionID(),
             key.c_str());
    return nullptr;
  }
  auto parent = getFirstSessionWithHierarchy(hierarchy - 1, *list);
  if (!parent) {
    logInfo("parentSessionForChild: Unable to find session with hierarchy of %d for userInfoKey '%s'",
            hierarchy - 1, key.c_str());
  }
  return parent;
}

std::shared_ptr<VeltradSession> VeltradAgent::getAncestorWithAggregatorForSession(
    const VeltradSession& session) const {
  if (!session.userInfo()) {
    logInfo("getAncestorWithAggregatorForSession: No user info found for session %u", session.sessionID());
    return nullptr;
  }
  const std::int32_t hierarchy = session.getSessionHierarchy();
  const CorrelatedList* list = hierarchy < 1 ? nullptr : correlatedList(session);
  if (!list) return nullptr;
  return topmostAggregator(hierarchy, *list);
}

bool VeltradAgent::withAncestorAggregator(const VeltradSession& session,
                                          const std::function<void(VeltradSession&)>& use) {
  const Lock held(_lock);
  const auto ancestor = getAncestorWithAggregatorForSession(session);
  if (ancestor) use(*ancestor);
  return ancestor != nullptr;
}

void VeltradAgent::updateDownstreamSessions(const std::shared_ptr<VeltradSession>& session) {
  if (!session->userInfo()) {
    logInfo("updateDownstreamSessions: No user info found for session %u", session->sessionID());
    return;
  }
  const std::int32_t hierarchy = session->getSessionHierarchy();
  const Lock held(_lock);
  session->updateCombinedSessionID();
  session->syncReportingStates();
  const bool ancestorAggregates = hierarchy >= 1 && getAncestorWithAggregatorForSession(*session) != nullptr;
  if (ancestorAggregates) session->shutdownSessionAggregation();
  const CorrelatedList* list = correlatedList(*session);
  if (!list) return;
  for (const auto& below : *list) {
    if (below->getSessionHierarchy() <= hierarchy) continue;
    logDebug(
        "updateDownstreamSessions: Updating combined session ID and syncing reporting states for session %u",
        below->sessionID());
    below->updateCombinedSessionID();
    below->syncReportingStates();
    const bool above = session->hasAggregator() || ancestorAggregates;
    if (above && below->hasAggregator()) below->shutdownSessionAggregation();
  }
}

}  // namespace veltrad
