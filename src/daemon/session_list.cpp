// SPDX-License-Identifier: Apache-2.0
// Adds, updates and removes sessions.
#include "daemon/session_list.h"

#include <algorithm>

#include "platform/transaction.h"
#include "session/veltrad_session.h"

namespace veltrad::daemon {

void SessionList::add(std::shared_ptr<session::VeltradSession> session) {
  const session::Aggregation* key = &session->aggregation();
  const Lock held(_lock);
  if (_sessions.empty()) _transaction.open();
  const std::uint64_t number = _accepted.fetch_add(1, std::memory_order_relaxed) + 1;
  _sessions.emplace(key, Entry{std::move(session), {number, {}}});
  _size.store(_sessions.size(), std::memory_order_relaxed);
}

void SessionList::remove(const session::VeltradSession& session) {
  Sessions::node_type left;  // goes after the lock
  const Lock held(_lock);
  left = _sessions.extract(&session.aggregation());
  _size.store(_sessions.size(), std::memory_order_relaxed);
  if (_sessions.empty()) _transaction.close();
}

void SessionList::tell(session::FamilyFacts facts) {
  const Lock held(_lock);
  const auto at = _sessions.find(facts.aggregation.get());
  if (at != _sessions.end()) std::swap(at->second.listed.facts, facts);
}

std::vector<ListedSession> SessionList::all() const {
  std::vector<ListedSession> listed;
  {
    const Lock held(_lock);
    listed.reserve(_sessions.size());
    for (const auto& [aggregation, entry] : _sessions) listed.push_back(entry.listed);
  }
  std::sort(listed.begin(), listed.end(),
            [](const ListedSession& a, const ListedSession& b) { return a.number < b.number; });
  return listed;
}

}  // namespace veltrad::daemon
