// Sessions that share a user-info key, in the order of joining, with an index of their levels. Under the
// agent's lock.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "session/veltrad_session.h"

namespace veltrad::daemon {

// What the sessions above a level are called together: their ID strings from the root to the parent, joined
// by
// ".". `complete` is false when one of them is missing; the text then begins after the gap.
struct AncestorIDs {
  std::string text;
  bool complete = true;
};

// A session's level is its hierarchy number (getSessionHierarchy) at the time of join() or refreshLevel():
// the registry refreshes it whenever the session's states were recomputed.
class CorrelatedList {
 public:
  using SessionPointer = std::shared_ptr<session::VeltradSession>;

  void join(const SessionPointer& session);  // at the end, unless it is in already
  void leave(const session::VeltradSession& session);
  void refreshLevel(const session::VeltradSession& session);
  bool contains(const session::VeltradSession& session) const { return _places.count(&session) > 0; }
  bool empty() const { return _places.empty(); }

  // The first that joined of those with this hierarchy number, or null.
  SessionPointer getFirstSessionWithHierarchy(std::int64_t hierarchy) const;
  // The first of each level from 0 to `hierarchy` - 1, from the root down: the first of these that
  // aggregates, or null.
  SessionPointer topmostAggregator(std::int32_t hierarchy) const;
  AncestorIDs ancestorIDs(std::int32_t hierarchy) const;
  // Those with a greater hierarchy number, in the order of joining.
  std::vector<SessionPointer> below(std::int32_t hierarchy) const;

 private:
  // In the order of joining; never empty.
  using Level = std::map<std::uint64_t, SessionPointer>;
  struct Place {
    std::int32_t level;
    std::uint64_t joined;
  };
  SessionPointer take(const Place& place);

  std::uint64_t _nextJoined = 0;
  std::unordered_map<const session::VeltradSession*, Place> _places;
  std::map<std::int64_t, Level> _levels;
};

}  // namespace veltrad::daemon
