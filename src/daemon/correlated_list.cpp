// Looking up sessions by their level.
#include "daemon/correlated_list.h"

#include <utility>

namespace veltrad::daemon {

void CorrelatedList::join(const SessionPointer& session) {
  const Place place{session->getSessionHierarchy(), _nextJoined};
  if (!_places.emplace(session.get(), place).second) return;
  ++_nextJoined;
  _levels[place.level].emplace(place.joined, session);
}

void CorrelatedList::leave(const session::VeltradSession& session) {
  const auto at = _places.find(&session);
  if (at == _places.end()) return;
  const SessionPointer kept = take(at->second);  // may be the last reference
  _places.erase(at);
}

void CorrelatedList::refreshLevel(const session::VeltradSession& session) {
  const auto at = _places.find(&session);
  const std::int32_t level = session.getSessionHierarchy();
  if (at == _places.end() || at->second.level == level) return;
  SessionPointer moved = take(at->second);
  at->second.level = level;
  _levels[level].emplace(at->second.joined, std::move(moved));
}

CorrelatedList::SessionPointer CorrelatedList::take(const Place& place) {
  const auto level = _levels.find(place.level);
  SessionPointer taken = std::move(level->second.extract(place.joined).mapped());
  if (level->second.empty()) _levels.erase(level);
  return taken;
}

CorrelatedList::SessionPointer CorrelatedList::getFirstSessionWithHierarchy(std::int64_t hierarchy) const {
  const auto level = _levels.find(hierarchy);
  return level == _levels.end() ? nullptr : level->second.begin()->second;
}

CorrelatedList::SessionPointer CorrelatedList::topmostAggregator(std::int32_t hierarchy) const {
  for (auto level = _levels.lower_bound(0); level != _levels.end() && level->first < hierarchy; ++level) {
    const SessionPointer& first = level->second.begin()->second;
    if (first->hasAggregator()) return first;
  }
  return nullptr;
}

AncestorIDs CorrelatedList::ancestorIDs(std::int32_t hierarchy) const {
  std::vector<const std::string*> upwards;
  std::int32_t level = hierarchy - 1;
  for (; level >= 0; --level) {
    const auto found = _levels.find(level);
    if (found == _levels.end()) break;
    upwards.push_back(&found->second.begin()->second->sessionIDString());
  }
  AncestorIDs ids;
  ids.complete = level < 0;
  for (auto id = upwards.rbegin(); id != upwards.rend(); ++id) {
    if (!ids.text.empty()) ids.text += '.';
    ids.text += **id;
  }
  return ids;
}

std::vector<CorrelatedList::SessionPointer> CorrelatedList::below(std::int32_t hierarchy) const {
  std::map<std::uint64_t, SessionPointer> found;
  for (auto level = _levels.upper_bound(hierarchy); level != _levels.end(); ++level) {
    found.insert(level->second.begin(), level->second.end());
  }
  std::vector<SessionPointer> sessions;
  sessions.reserve(found.size());
  for (auto& [joined, session] : found) sessions.push_back(std::move(session));
  return sessions;
}

}  // namespace veltrad::daemon
