// The agent's hierarchy: parents, ancestors that aggregate, and the refreshing of a chain.
#include "daemon/correlated_list.h"
#include "daemon/user_info_key.h"
#include "daemon/veltrad_agent.h"
#include "platform/log.h"

namespace veltrad::daemon {

const CorrelatedList* VeltradAgent::correlatedList(const session::VeltradSession& session) {
  backends::SharedDictionary userInfo = session.userInfo();
  const auto membership = _memberships.find(&session);
  const bool member = membership != _memberships.end();
  if (member && userInfo && membership->second.userInfo == userInfo) return membership->second.list;
  const std::string key = userInfoKeyForUserInfo(userInfo.get());
  if (member && membership->second.key == key) membership->second.userInfo = std::move(userInfo);
  const auto list = _correlatedSessions.find(std::string_view(key));
  return list == _correlatedSessions.end() ? nullptr : &list->second;
}

const CorrelatedList* VeltradAgent::listHolding(const session::VeltradSession& session,
                                                const std::string& key, const char* operation) {
  const CorrelatedList* list = correlatedList(session);
  if (!list || list->empty()) {
    logError("%s: ERROR: No sessions found for user info key %s", operation, key.c_str());
    return nullptr;
  }
  if (!list->contains(session)) {
    logError("%s: ERROR: Session %u not found for user info key %s", operation, session.sessionID(),
             key.c_str());
    return nullptr;
  }
  return list;
}

std::optional<std::string> VeltradAgent::parentSessionIDStringForSession(
    const session::VeltradSession& session) {
  const std::int32_t hierarchy = session.getSessionHierarchy();
  if (hierarchy == 0) return std::nullopt;
  const std::string key = userInfoKeyForUserInfo(session.userInfo().get());
  logDebug("parentSessionIDStringForSession: Checking userInfoKey '%s' for session %u", key.c_str(),
           session.sessionID());
  const Lock held(_lock);
  const CorrelatedList* list = listHolding(session, key, "parentSessionIDStringForSession");
  if (!list || hierarchy < 0) return std::nullopt;
  AncestorIDs ids = list->ancestorIDs(hierarchy);
  if (!ids.complete) {
    logInfo(
        "parentSessionIDStringForSession: Found a gap in hierarchy (one of parents missing): incomplete "
        "parentSessionID is '%s'",
        ids.text.c_str());
  }
  if (ids.text.empty()) return std::nullopt;
  return std::move(ids.text);
}

std::shared_ptr<session::VeltradSession> VeltradAgent::parentSessionForChild(
    const session::VeltradSession& session) {
  const std::int32_t hierarchy = session.getSessionHierarchy();
  if (hierarchy == 0) return nullptr;
  const std::string key = userInfoKeyForUserInfo(session.userInfo().get());
  logDebug("parentSessionForChild: Checking userInfoKey '%s' for session %u", key.c_str(),
           session.sessionID());
  const Lock held(_lock);
  const CorrelatedList* list = listHolding(session, key, "parentSessionForChild");
  if (!list) return nullptr;
  const std::int64_t above = std::int64_t{hierarchy} - 1;
  auto parent = list->getFirstSessionWithHierarchy(above);
  if (!parent) {
    logInfo("parentSessionForChild: Unable to find session with hierarchy of %lld for userInfoKey '%s'",
            static_cast<long long>(above), key.c_str());
  }
  return parent;
}

std::shared_ptr<session::VeltradSession> VeltradAgent::getAncestorWithAggregatorForSession(
    const session::VeltradSession& session) {
  if (!session.userInfo()) return nullptr;  // which the session says
  const std::int32_t hierarchy = session.getSessionHierarchy();
  const CorrelatedList* list = hierarchy < 1 ? nullptr : correlatedList(session);
  return list ? list->topmostAggregator(hierarchy) : nullptr;
}

bool VeltradAgent::withAncestorAggregator(const session::VeltradSession& session,
                                          const std::function<void(session::VeltradSession&)>& use) {
  const Lock held(_lock);
  const auto ancestor = getAncestorWithAggregatorForSession(session);
  if (ancestor) use(*ancestor);
  return ancestor != nullptr;
}

void VeltradAgent::updateDownstreamSessions(const std::shared_ptr<session::VeltradSession>& session) {
  std::vector<std::string> lines;
  {
    const Lock held(_lock);
    lines = updateDownstreamSessionsLocked(*session);
  }
  for (const std::string& line : lines) logError("%s", line.c_str());
}

std::vector<std::string> VeltradAgent::updateDownstreamSessionsLocked(session::VeltradSession& session) {
  std::vector<std::string> lines;
  const auto shutDown = [&lines](session::VeltradSession& ending) {
    if (auto line = ending.shutdownSessionAggregation()) lines.push_back(std::move(*line));
  };
  const auto membership = _memberships.find(&session);
  if (membership != _memberships.end()) membership->second.list->refreshLevel(session);
  if (!session.userInfo()) {
    logInfo("updateDownstreamSessions: No user info found for session %u", session.sessionID());
    return lines;
  }
  const std::int32_t hierarchy = session.getSessionHierarchy();
  session.updateCombinedSessionID();
  session.syncReportingStates();
  const bool ancestorAggregates = hierarchy >= 1 && getAncestorWithAggregatorForSession(session) != nullptr;
  if (ancestorAggregates) shutDown(session);
  const CorrelatedList* list = correlatedList(session);
  if (!list) return lines;
  for (const auto& below : list->below(hierarchy)) {
    logDebug(
        "updateDownstreamSessions: Updating combined session ID and syncing reporting states for session %u",
        below->sessionID());
    below->updateCombinedSessionID();
    below->syncReportingStates();
    const bool above = session.hasAggregator() || ancestorAggregates;
    if (above && below->hasAggregator()) shutDown(*below);
  }
  return lines;
}

}  // namespace veltrad::daemon
