// SPDX-License-Identifier: Apache-2.0
// Finds sessions by their level.
#include "daemon/correlated_list.h"

#include <algorithm>
#include <limits>

namespace veltrad::daemon {

void CorrelatedList::join(FamilyMember& member) {
  member.joined = _nextJoined++;
  member.level = session::hierarchyOf(member.facts.backends.get());
  _members.emplace(std::pair(member.level, member.joined), &member);
}

void CorrelatedList::leave(const FamilyMember& member) {
  _members.erase({member.level, member.joined});
}

void CorrelatedList::refreshLevel(FamilyMember& member) {
  auto moved = _members.extract({member.level, member.joined});
  member.level = session::hierarchyOf(member.facts.backends.get());
  if (moved.empty()) return;
  moved.key().first = member.level;
  _members.insert(std::move(moved));
}

const FamilyMember* CorrelatedList::getFirstSessionWithHierarchy(std::int64_t hierarchy) const {
  const auto first = _members.lower_bound({hierarchy, 0});
  return first == _members.end() || first->first.first != hierarchy ? nullptr : first->second;
}

const FamilyMember* CorrelatedList::topmostAggregator(std::int32_t hierarchy) const {
  auto first = _members.lower_bound({0, 0});
  while (first != _members.end() && first->first.first < hierarchy) {
    if (first->second->facts.aggregation->active()) return first->second;
    first = _members.lower_bound({first->first.first + 1, 0});
  }
  return nullptr;
}

AncestorIDs CorrelatedList::ancestorIDs(std::int32_t hierarchy) const {
  AncestorIDs ids;
  for (std::int64_t level = std::int64_t{hierarchy} - 1; level >= 0; --level) {
    const FamilyMember* ancestor = getFirstSessionWithHierarchy(level);
    if (!ancestor) {
      ids.complete = false;
      break;
    }
    ids.text = ancestor->facts.sessionIDString + (ids.text.empty() ? "" : "." + ids.text);
  }
  return ids;
}

std::vector<const FamilyMember*> CorrelatedList::below(std::int32_t hierarchy) const {
  const auto begin = _members.upper_bound({hierarchy, std::numeric_limits<std::uint64_t>::max()});
  std::vector<const FamilyMember*> members;
  std::transform(begin, _members.end(), std::back_inserter(members),
                 [](const auto& at) { return at.second; });
  std::sort(members.begin(), members.end(),
            [](const FamilyMember* a, const FamilyMember* b) { return a->joined < b->joined; });
  return members;
}

}  // namespace veltrad::daemon
