// VeltradAgent: accepts connections and knows every session. Connections' threads call it; it locks for
// itself.
#pragma once

#include <atomic>
#include <map>
#include <memory>
#include <memory_resource>
#include <string>
#include <unordered_map>
#include <vector>

#include "base/mutex.h"
#include "daemon/correlated_list.h"
#include "daemon/lock_ranks.h"
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
  void changeIdentity(const std::function<void()>& change) override;
  void userInfoUpdatedForSession(const std::shared_ptr<session::VeltradSession>& session) override;
  std::optional<std::string> parentSessionIDStringForSession(const session::VeltradSession& session) override;
  std::shared_ptr<session::VeltradSession> parentSessionForChild(
      const session::VeltradSession& session) override;
  bool withAncestorAggregator(const session::VeltradSession& session,
                              const std::function<void(session::VeltradSession&)>& use) override;
  void updateDownstreamSessions(const std::shared_ptr<session::VeltradSession>& session) override;
  std::string description() const override;

  // Without a lock, for log lines and the service manager's status.
  std::size_t sessionCount() const { return _sessionCount.load(std::memory_order_relaxed); }
  // All that ever came. Without a lock.
  std::uint64_t acceptedSessions() const { return _acceptedSessions.load(std::memory_order_relaxed); }
  std::size_t userInfoKeyCount() const { return _userInfoKeyCount.load(std::memory_order_relaxed); }

 private:
  void addSession(std::shared_ptr<session::VeltradSession> session);
  void sessionInvalidated(const std::shared_ptr<session::VeltradSession>& session);
  void leaveCorrelatedList(const session::VeltradSession& session) REQUIRES(_lock);
  // The sessions that share the session's key; null where the key has no list.
  const CorrelatedList* correlatedList(const session::VeltradSession& session) REQUIRES(_lock);
  // The same; null, with a log line, also where the session is not in it.
  const CorrelatedList* listHolding(const session::VeltradSession& session, const std::string& key,
                                    const char* operation) REQUIRES(_lock);
  std::shared_ptr<session::VeltradSession> getAncestorWithAggregatorForSession(
      const session::VeltradSession& session) REQUIRES(_lock);
  // The lines that are to be logged once the lock is released.
  std::vector<std::string> updateDownstreamSessionsLocked(session::VeltradSession& session) REQUIRES(_lock);

  // Constant after construction.
  const session::SessionServices _services;
  platform::Transaction& _transaction;

  // Also covers opening and closing the transaction.
  RecursiveMutex _sessionListLock SESSION_LIST_LOCK;
  std::vector<std::shared_ptr<session::VeltradSession>> _sessionList GUARDED_BY(_sessionListLock);

  RecursiveMutex _lock STOREBAG_CACHE_LOCK;
  StorebagCache _cachedStorebags GUARDED_BY(_lock);
  // Empty lists stay, within a bound. They have memory of their own: each would otherwise hold a page of what
  // the sessions beside it have freed.
  std::pmr::unsynchronized_pool_resource _listMemory GUARDED_BY(_lock);
  std::pmr::map<std::pmr::string, CorrelatedList, std::less<>> _correlatedSessions GUARDED_BY(_lock){
      &_listMemory};
  // The one list that a session is in. `userInfo` is the dictionary whose key was last seen to be this one,
  // so that a message does not form the key again.
  struct Membership {
    std::string key;
    CorrelatedList* list;
    backends::SharedDictionary userInfo;
  };
  std::unordered_map<const session::VeltradSession*, Membership> _memberships GUARDED_BY(_lock);

  // Kept beside the collections.
  std::atomic<std::size_t> _sessionCount{0};
  std::atomic<std::uint64_t> _acceptedSessions{0};
  std::atomic<std::size_t> _userInfoKeyCount{0};
};

}  // namespace veltrad::daemon
