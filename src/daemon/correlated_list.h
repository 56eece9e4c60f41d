// Sessions that share a user-info key, in the order of joining, with an index of their levels. Under the
// families' lock.
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

// What the sessions above a level are called together: their ID strings from the root to the parent, joined
// by
// ".". `complete` is false when one of them is missing; the text then begins after the gap.
struct AncestorIDs {
  std::string text;
  bool complete = true;
};

struct FamilyMember;

// Members outlive their time in it.
class CorrelatedList {
 public:
  void join(FamilyMember& member);  // at the end; it is in none
  void leave(const FamilyMember& member);
  void refreshLevel(FamilyMember& member);
  bool empty() const { return _members.empty(); }

  // The first that joined of those with this hierarchy number, or null.
  const FamilyMember* getFirstSessionWithHierarchy(std::int64_t hierarchy) const;
  // The first of each level from 0 to `hierarchy` - 1, from the root down: the first of these that
  // aggregates, or null.
  const FamilyMember* topmostAggregator(std::int32_t hierarchy) const;
  AncestorIDs ancestorIDs(std::int32_t hierarchy) const;
  // Those with a greater hierarchy number, in the order of joining.
  std::vector<const FamilyMember*> below(std::int32_t hierarchy) const;

 private:
  std::uint64_t _nextJoined = 0;
  std::map<std::pair<std::int64_t, std::uint64_t>, const FamilyMember*> _members;  // by level, then joining
};

using CorrelatedLists = std::pmr::map<std::pmr::string, CorrelatedList, std::less<>>;  // by user-info key

// A session as its family knows it.
struct FamilyMember {
  session::FamilyFacts facts;      // that it told last
  std::string key;                 // of the user info in them
  CorrelatedLists::iterator home;  // the one list that it is in
  // That list's alone. The level is the hierarchy number at the last refreshLevel().
  std::int32_t level = 0;
  std::uint64_t joined = 0;
};

}  // namespace veltrad::daemon
