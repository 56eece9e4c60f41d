// SPDX-License-Identifier: Apache-2.0
// Families: the sessions that share an identity. Determines each session's parent and combined ID, its back
// ends' states, and which client gets copies.
#pragma once

#include <atomic>
#include <cstddef>
#include <map>
#include <memory_resource>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "daemon/correlated_list.h"
#include "daemon/lock_ranks.h"

namespace veltrad::daemon {

// Any thread. Does not call sessions; it uses the facts that they have registered. Under its lock it reads
// and sets states and IDs of back ends, and queues copies and end marks, none of which block. The results of
// a refresh are set under the lock, because they must not overwrite those of a later one.
class Families {
 public:
  // Does nothing if the session is in no family.
  void sessionInfoUpdated(session::FamilyFacts facts);
  void userInfoUpdatedForSession(session::FamilyFacts facts);
  void updateDownstreamSessions(session::FamilyFacts facts);
  void leave(const session::Aggregation& session);

  bool ancestorAggregates(const session::FamilyPlace& place);
  session::CopySent sendToAncestor(const session::FamilyPlace& place, std::string_view copy);

  // The parent of each session that has one.
  using Parents = std::map<const session::Aggregation*, const session::Aggregation*>;
  Parents parents();

  // Without a lock.
  std::size_t userInfoKeyCount() const { return _userInfoKeyCount.load(std::memory_order_relaxed); }

 private:
  using Members = std::unordered_map<const session::Aggregation*, FamilyMember>;

  // Objects that these return or swap out must be destroyed after the lock is released.
  void tell(FamilyMember& member, session::FamilyFacts& facts, std::string& key) REQUIRES(_lock);
  Members::node_type takeOut(const session::Aggregation& session) REQUIRES(_lock);
  const CorrelatedList* list(std::string_view key) const REQUIRES(_lock);
  const CorrelatedList* listHolding(const FamilyMember& member, const char* operation) const REQUIRES(_lock);
  std::optional<std::string> parentSessionIDString(const FamilyMember& member) const REQUIRES(_lock);
  const FamilyMember* parentSession(const FamilyMember& member) const REQUIRES(_lock);
  const FamilyMember* ancestorWithAggregator(const session::FamilyPlace& place) const REQUIRES(_lock);
  void updateCombinedSessionID(const FamilyMember& member) const REQUIRES(_lock);
  void syncReportingStates(const FamilyMember& member) const REQUIRES(_lock);
  // Adds errors to `lines`.
  void refresh(FamilyMember& member, std::vector<std::string>& lines) REQUIRES(_lock);

  Mutex _lock FAMILIES_LOCK;
  // Empty lists are kept, up to a bound. They have a memory pool, so that they do not keep pages alive that
  // sessions have otherwise freed.
  std::pmr::unsynchronized_pool_resource _listMemory GUARDED_BY(_lock);
  CorrelatedLists _correlatedSessions GUARDED_BY(_lock){&_listMemory};
  Members _members GUARDED_BY(_lock);

  std::atomic<std::size_t> _userInfoKeyCount{0};
};

}  // namespace veltrad::daemon
