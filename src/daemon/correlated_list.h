// SPDX-License-Identifier: Apache-2.0
// Sessions that share a user-info key, ordered by level and time of joining. Guarded by the families' lock.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory_resource>
#include <string>
#include <utility>
#include <vector>

#include "session/session_delegate.h"

namespace veltrad::daemon {

// The ID strings of the sessions above a level, from the root to the parent, joined by ".". If one is
// missing, `complete` is false and the text begins after the gap.
struct AncestorIDs {
  std::string text;
  bool complete = true;
};

struct FamilyMember;

// A member must leave before it is destroyed.
class CorrelatedList {
 public:
  void join(FamilyMember& member);
  void leave(const FamilyMember& member);
  void refreshLevel(FamilyMember& member);
  bool empty() const { return _members.empty(); }

  // The first member that joined with this hierarchy number, or null.
  const FamilyMember* getFirstSessionWithHierarchy(std::int64_t hierarchy) const;
  // Looks at the first member of each level above `hierarchy`, from the root down. Returns the first that
  // aggregates, or null.
  const FamilyMember* topmostAggregator(std::int32_t hierarchy) const;
  AncestorIDs ancestorIDs(std::int32_t hierarchy) const;
  // The members with a greater hierarchy number, in the order of joining.
  std::vector<const FamilyMember*> below(std::int32_t hierarchy) const;

 private:
  std::uint64_t _nextJoined = 0;
  // By level, then order of joining.
  std::map<std::pair<std::int64_t, std::uint64_t>, const FamilyMember*> _members;
};

using CorrelatedLists = std::pmr::map<std::pmr::string, CorrelatedList, std::less<>>;

struct FamilyMember {
  session::FamilyFacts facts;
  // The user-info key of the facts. The member may still be in the list of an earlier key.
  std::string key;
  CorrelatedLists::iterator home;
  // Used by that list only. The level is the hierarchy number at the last refreshLevel().
  std::int32_t level = 0;
  std::uint64_t joined = 0;
};

}  // namespace veltrad::daemon
