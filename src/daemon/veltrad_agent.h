// VeltradAgent: accepts connections and has the three collections that sessions share. Connections' threads
// call it; each collection locks for itself.
#pragma once

#include <memory>
#include <string>

#include "daemon/families.h"
#include "daemon/session_list.h"
#include "daemon/storebag_cache.h"
#include "ipc/connection.h"
#include "session/session_delegate.h"
#include "session/veltrad_session.h"

namespace veltrad::platform {
class Transaction;
}  // namespace veltrad::platform

namespace veltrad::daemon {

// One for the life of the process. It outlives the listener and every session; what the constructor takes
// outlives it.
class VeltradAgent final : public ipc::ListenerDelegate, public session::VeltradSessionDelegate {
 public:
  VeltradAgent(const session::SessionServices& services, config::StorebagSource& source,
               platform::Transaction& transaction);

  bool listener(ipc::Listener& listener,
                const std::shared_ptr<ipc::Connection>& shouldAcceptNewConnection) override;

  std::shared_ptr<const config::StorebagSection> storebagForSession(
      const session::VeltradSession& session) override;
  std::optional<std::string> storebagVersionForSession(const session::VeltradSession& session) override;
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

  // Without a lock, for log lines and the service manager's status.
  std::size_t sessionCount() const { return _sessionList.size(); }
  // All that ever came. Without a lock.
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
