// VeltradAgent: accepts connections and knows every session. Connections' threads call it; it locks for
// itself.
#pragma once

#include <atomic>
#include <map>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "base/mutex.h"
#include "daemon/correlated_list.h"
#include "daemon/storebag_cache.h"
#include "protocol/connection.h"
#include "session/session_delegate.h"
#include "session/veltrad_session.h"

namespace veltrad {

namespace platform {
class Transaction;
}

// One for the life of the process. It outlives the listener and every session; what the constructor takes
// outlives it.
class VeltradAgent final : public ListenerDelegate, public VeltradSessionDelegate {
 public:
  VeltradAgent(const SessionServices& services, StorebagSource& source, platform::Transaction& transaction);

  bool listener(Listener& listener, const std::shared_ptr<Connection>& shouldAcceptNewConnection) override;

  std::shared_ptr<const Dictionary> storebagForSession(const VeltradSession& session) override;
  std::optional<std::string> storebagVersionForSession(const VeltradSession& session) override;
  void changeIdentity(const std::function<void()>& change) override;
  void userInfoUpdatedForSession(const std::shared_ptr<VeltradSession>& session) override;
  std::optional<std::string> parentSessionIDStringForSession(const VeltradSession& session) override;
  std::shared_ptr<VeltradSession> parentSessionForChild(const VeltradSession& session) override;
  bool withAncestorAggregator(const VeltradSession& session,
                              const std::function<void(VeltradSession&)>& use) override;
  void updateDownstreamSessions(const std::shared_ptr<VeltradSession>& session) override;
  std::string description() const override;

  // Without a lock, for log lines and the service manager's status.
  std::size_t sessionCount() const { return _sessionCount.load(std::memory_order_relaxed); }
  std::size_t userInfoKeyCount() const { return _userInfoKeyCount.load(std::memory_order_relaxed); }

 private:
  void addSession(std::shared_ptr<VeltradSession> session);
  void sessionInvalidated(const std::shared_ptr<VeltradSession>& session);
  void leaveCorrelatedList(const VeltradSession& session) REQUIRES(_lock);
  // The sessions that share the session's key; null where the key has no list.
  const CorrelatedList* correlatedList(const VeltradSession& session) REQUIRES(_lock);
  // The same; null, with a log line, also where the session is not in it.
  const CorrelatedList* listHolding(const VeltradSession& session, const std::string& key,
                                    const char* operation) REQUIRES(_lock);
  std::shared_ptr<VeltradSession> getAncestorWithAggregatorForSession(const VeltradSession& session)
      REQUIRES(_lock);
  // The lines that are to be logged once the lock is released.
  std::vector<std::string> updateDownstreamSessionsLocked(VeltradSession& session) REQUIRES(_lock);

  // Constant after construction.
  const SessionServices _services;
  platform::Transaction& _transaction;

  // Also covers opening and closing the transaction.
  RecursiveMutex _sessionListLock SESSION_LIST_LOCK{LockRank::sessionList};
  std::vector<std::shared_ptr<VeltradSession>> _sessionList GUARDED_BY(_sessionListLock);

  RecursiveMutex _lock AGENT_LOCK{LockRank::agent};
  StorebagCache _cachedStorebags GUARDED_BY(_lock);
  // Empty lists stay, within a bound.
  std::map<std::string, CorrelatedList> _correlatedSessions GUARDED_BY(_lock);
  // The one list that a session is in. `userInfo` is the dictionary whose key was last seen to be this one,
  // so that a message does not form the key again.
  struct Membership {
    std::string key;
    CorrelatedList* list;
    SharedDictionary userInfo;
  };
  std::unordered_map<const VeltradSession*, Membership> _memberships GUARDED_BY(_lock);

  // Kept beside the collections.
  std::atomic<std::size_t> _sessionCount{0};
  std::atomic<std::size_t> _userInfoKeyCount{0};
};

}  // namespace veltrad
