// SPDX-License-Identifier: Apache-2.0
// VeltradAgent: accepts connections and owns the session list, the families and the storebag cache. Any
// thread.
#pragma once

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "daemon/families.h"
#include "daemon/session_list.h"
#include "daemon/storebag_cache.h"
#include "ipc/connection.h"
#include "platform/transaction.h"
#include "session/session_delegate.h"
#include "session/veltrad_session.h"

namespace veltrad::daemon {

// Outlives the listener and every session. The arguments of the constructor must outlive it.
class VeltradAgent final : public ipc::ListenerDelegate, public session::VeltradSessionDelegate {
 public:
  VeltradAgent(const session::SessionServices& services, config::StorebagSource& source,
               platform::Transaction& transaction);

  bool listener(ipc::Listener& listener,
                const std::shared_ptr<ipc::Connection>& shouldAcceptNewConnection) override;

  std::shared_ptr<const config::StorebagSection> storebagForSession(
      const session::VeltradSession& session) override;
  std::optional<std::string> storebagVersionForSession(const session::VeltradSession& session) override;
  wire::Reason reasonBehind(const session::VeltradSession& session, wire::Reason why) override;
  std::optional<session::StorebagNow> storebagNow(const session::VeltradSession& session) override;
  void sessionInfoUpdated(session::FamilyFacts facts) override {
    _sessionList.tell(facts);
    _families.sessionInfoUpdated(std::move(facts));
  }
  void userInfoUpdatedForSession(session::FamilyFacts facts) override {
    _sessionList.tell(facts);
    _families.userInfoUpdatedForSession(std::move(facts));
  }
  void updateDownstreamSessions(session::FamilyFacts facts) override {
    _families.updateDownstreamSessions(std::move(facts));
  }
  bool ancestorAggregates(const session::FamilyPlace& place) override {
    return _families.ancestorAggregates(place);
  }
  session::CopySent sendToAncestor(const session::FamilyPlace& place, std::string_view copy) override {
    return _families.sendToAncestor(place, copy);
  }
  std::string description() const override;

  // Applies the owner's decision to the back ends of all sessions; back ends that may not report drop their
  // waiting data.
  void tellOwnerDecision(const config::OwnerDecision& decision);
  // The open sessions by the name of their storebag; those that have none are left out.
  using Followers = std::map<std::string, std::vector<ListedSession>>;
  Followers followers() const;
  // Drops waiting data with the device's identifier in the back ends of all sessions.
  void dropIdentified();
  std::size_t sessionCount() const { return _sessionList.size(); }
  std::uint64_t acceptedSessions() const { return _sessionList.accepted(); }
  std::size_t userInfoKeyCount() const { return _families.userInfoKeyCount(); }

  // For observers.
  std::vector<ListedSession> sessions() const { return _sessionList.all(); }
  Families::Parents parents() { return _families.parents(); }
  StorebagCache& storebags() { return _cachedStorebags; }

 private:
  void sessionInvalidated(const std::shared_ptr<session::VeltradSession>& session);

  const session::SessionServices _services;
  SessionList _sessionList;
  StorebagCache _cachedStorebags;
  Families _families;
};

}  // namespace veltrad::daemon
