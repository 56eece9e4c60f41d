// Acceptance and invalidation of connections; the sessions' registry.
#include "daemon/veltrad_agent.h"

#include <fmt/format.h>

#include <algorithm>

#include "daemon/user_info_key.h"
#include "platform/counters.h"
#include "platform/log.h"
#include "platform/transaction.h"
#include "wire/constants.h"

namespace veltrad::daemon {

namespace {
// Of lists that nobody is in any more: so many identities, and no long names, or clients that invent them
// grow the daemon without end.
constexpr std::size_t kMostKeys = 4096;
constexpr std::size_t kLongestIdleKey = 256;  // bytes
}  // namespace

VeltradAgent::VeltradAgent(const session::SessionServices& services, config::StorebagSource& source,
                           platform::Transaction& transaction)
    : _services(services), _transaction(transaction), _cachedStorebags(source, services.clock) {}

std::string VeltradAgent::description() const {
  return fmt::format("<VeltradAgent: {}>", fmt::ptr(this));
}

bool VeltradAgent::listener(ipc::Listener&, const std::shared_ptr<ipc::Connection>& connection) {
  const auto entitlement = connection->valueForEntitlement(wire::kVeltraEntitlement);
  // Only a boolean true passes; the number 1 does not.
  if (!entitlement || !entitlement->isBoolean() || !entitlement->toBoolean().value_or(false)) {
    logDebug(
        "listener: new Vopex connection %s does not have required veltra entitlement. Closing connection...",
        connection->description().c_str());
    return false;
  }
  logDebug("listener: Accepting new Vopex connection %s as it has proper entitlement, %d(%d) connections.",
           connection->description().c_str(), static_cast<int>(sessionCount()),
           static_cast<int>(userInfoKeyCount()));
  const auto session = session::VeltradSession::initWithSessionDelegate(_services, *this, connection);
  connection->setExportedObject(session);
  addSession(session);
  const std::string name = session->description();
  connection->setInterruptionHandler(
      [name] { logDebug("listener: Vopex connection to %s was interrupted", name.c_str()); });
  connection->setInvalidationHandler([this, session] { sessionInvalidated(session); });
  connection->resume();
  return true;
}

void VeltradAgent::addSession(std::shared_ptr<session::VeltradSession> session) {
  const Lock held(_sessionListLock);
  if (_sessionList.empty()) _transaction.open();
  _sessionList.push_back(std::move(session));
  _acceptedSessions.fetch_add(1, std::memory_order_relaxed);
  _sessionCount.store(_sessionList.size(), std::memory_order_relaxed);
}

void VeltradAgent::sessionInvalidated(const std::shared_ptr<session::VeltradSession>& session) {
  logDebug("listener: Vopex connection to %s was invalidated", session->description().c_str());
  {
    const Lock held(_sessionListLock);
    std::erase(_sessionList, session);
    _sessionCount.store(_sessionList.size(), std::memory_order_relaxed);
    if (_sessionList.empty()) _transaction.close();
  }
  const Lock held(_lock);
  leaveCorrelatedList(*session);
}

// By the remembered key: the session's user info may have been taken away since it joined.
void VeltradAgent::leaveCorrelatedList(const session::VeltradSession& session) {
  const auto membership = _memberships.find(&session);
  if (membership == _memberships.end()) return;
  const std::string key = std::move(membership->second.key);
  CorrelatedList& list = *membership->second.list;
  _memberships.erase(membership);
  list.leave(session);
  if (list.empty()) {
    if (key.size() > kLongestIdleKey || _correlatedSessions.size() > kMostKeys) {
      _correlatedSessions.erase(_correlatedSessions.find(std::string_view(key)));
    } else {
      list = CorrelatedList();  // keeps nothing of its size
    }
  }
  _userInfoKeyCount.store(_correlatedSessions.size(), std::memory_order_relaxed);
}

std::shared_ptr<const config::StorebagSection> VeltradAgent::storebagForSession(
    const session::VeltradSession& session) {
  const std::int32_t clientType = session.clientType().value_or(0);
  logDebug("storebagForSession: Retrieving storebag for session %u with client type %d", session.sessionID(),
           clientType);
  const Lock held(_lock);
  return _cachedStorebags.storebagForClientType(clientType, _lock);
}

std::optional<std::string> VeltradAgent::storebagVersionForSession(const session::VeltradSession& session) {
  const Lock held(_lock);
  return _cachedStorebags.versionForClientType(session.clientType().value_or(0));
}

void VeltradAgent::changeIdentity(const std::function<void()>& change) {
  const Lock held(_lock);
  change();
}

void VeltradAgent::userInfoUpdatedForSession(const std::shared_ptr<session::VeltradSession>& session) {
  const backends::SharedDictionary userInfo = session->userInfo();
  if (!userInfo) {
    logInfo("userInfoUpdatedForSession: No user info found for session %u", session->sessionID());
    return;
  }
  const std::string key = userInfoKeyForUserInfo(userInfo.get());
  const Lock held(_lock);
  leaveCorrelatedList(*session);
  logDebug("userInfoUpdatedForSession: Adding session %u to list for userInfoKey %s", session->sessionID(),
           key.c_str());
  CorrelatedList& list = _correlatedSessions.try_emplace(std::pmr::string(key)).first->second;
  list.join(session);
  _memberships[session.get()] = {key, &list, userInfo};
  _userInfoKeyCount.store(_correlatedSessions.size(), std::memory_order_relaxed);
}

}  // namespace veltrad::daemon
