// Sessions that share a user-info key, in the order of joining. Plain functions; under the agent's lock.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "session/veltrad_session.h"

namespace veltrad {

using CorrelatedList = std::vector<std::shared_ptr<VeltradSession>>;

// The first with this hierarchy number, or null.
std::shared_ptr<VeltradSession> getFirstSessionWithHierarchy(std::int32_t hierarchy,
                                                             const CorrelatedList& inSessionList);

bool contains(const CorrelatedList& list, const VeltradSession& session);

// What the sessions above `hierarchy` are called together: their ID strings from the root to the
// parent, joined by ".". `complete` is false when one of them is missing; the text then begins after the gap.
struct AncestorIDs {
  std::string text;
  bool complete = true;
};
// The first session of each level above `hierarchy`, from the root down: the first of these that aggregates,
// or null. Linear-logarithmic in the list, whatever the number.
std::shared_ptr<VeltradSession> topmostAggregator(std::int32_t hierarchy, const CorrelatedList& list);
AncestorIDs ancestorIDs(std::int32_t hierarchy, const CorrelatedList& list);

}  // namespace veltrad
