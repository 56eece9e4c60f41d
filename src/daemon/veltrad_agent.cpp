// SPDX-License-Identifier: Apache-2.0
// Accepts and removes connections.
#include "daemon/veltrad_agent.h"

#include <fmt/format.h>

#include "config/client_types.h"
#include "platform/log.h"
#include "wire/constants.h"

namespace veltrad::daemon {

VeltradAgent::VeltradAgent(const session::SessionServices& services, config::StorebagSource& source,
                           platform::Transaction& transaction)
    : _services(services), _sessionList(transaction), _cachedStorebags(source, services.clock) {}

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
  _sessionList.add(session);
  const std::string name = session->description();
  connection->setInterruptionHandler(
      [name] { logDebug("listener: Vopex connection to %s was interrupted", name.c_str()); });
  connection->setInvalidationHandler([this, session] { sessionInvalidated(session); });
  connection->resume();
  return true;
}

void VeltradAgent::sessionInvalidated(const std::shared_ptr<session::VeltradSession>& session) {
  logDebug("listener: Vopex connection to %s was invalidated", session->description().c_str());
  _sessionList.remove(*session);
  _families.leave(session->aggregation());
}

void VeltradAgent::tellOwnerDecision(const config::OwnerDecision& decision) {
  for (const ListedSession& listed : _sessionList.all()) {
    if (!listed.facts.backends) continue;
    for (const auto& [name, backend] : *listed.facts.backends) {
      const bool fixed = backend->hostsAreFixed();
      const auto refusal = decision.refusalFor(name, fixed ? backend->hosts() : std::vector<std::string>());
      // The session itself finds out at its next call whether hosts that change are listed now.
      const bool hostsUnknown = !fixed && !refusal && backend->prohibition() == wire::Reason::policy_hosts;
      if (!hostsUnknown) backend->setProhibition(refusal);
    }
  }
}

void VeltradAgent::dropIdentified() {
  for (const ListedSession& listed : _sessionList.all()) {
    if (!listed.facts.backends) continue;
    for (const auto& [name, backend] : *listed.facts.backends) backend->dropIdentified();
  }
}

std::shared_ptr<const config::StorebagSection> VeltradAgent::storebagForSession(
    const session::VeltradSession& session) {
  const std::int32_t clientType = session.clientType().value_or(0);
  logDebug("storebagForSession: Retrieving storebag for session %u with client type %d", session.sessionID(),
           clientType);
  return _cachedStorebags.storebagForClientType(clientType);
}

std::optional<session::StorebagNow> VeltradAgent::storebagNow(const session::VeltradSession& session) {
  auto standing = _cachedStorebags.standingForClientType(session.clientType().value_or(0));
  if (!standing.known) return std::nullopt;
  return session::StorebagNow{std::move(standing.section), std::move(standing.version)};
}

wire::Reason VeltradAgent::reasonBehind(const session::VeltradSession& session, wire::Reason why) {
  if (why != wire::Reason::no_backends && why != wire::Reason::no_storebag) return why;
  return _cachedStorebags.refusalForClientType(session.clientType().value_or(0)).value_or(why);
}

VeltradAgent::Followers VeltradAgent::followers() const {
  Followers followers;
  for (ListedSession& listed : _sessionList.all()) {
    const Dictionary* info = listed.facts.sessionInfo.get();
    const auto type = info ? info->int32(wire::kVeltraSessionInfoClientType) : std::nullopt;
    const char* name = type ? config::storebagNameForClientType(*type) : nullptr;
    if (name) followers[name].push_back(std::move(listed));
  }
  return followers;
}

std::optional<std::string> VeltradAgent::storebagVersionForSession(const session::VeltradSession& session) {
  return _cachedStorebags.versionForClientType(session.clientType().value_or(0));
}

}  // namespace veltrad::daemon
