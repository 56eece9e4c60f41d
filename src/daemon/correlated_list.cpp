// Looking up sessions by their level.
#include "daemon/correlated_list.h"

#include <algorithm>
#include <map>

namespace veltrad {

std::shared_ptr<VeltradSession> getFirstSessionWithHierarchy(std::int32_t hierarchy,
                                                             const CorrelatedList& inSessionList) {
  const auto at = std::find_if(inSessionList.begin(), inSessionList.end(), [hierarchy](const auto& session) {
    return session->getSessionHierarchy() == hierarchy;
  });
  return at == inSessionList.end() ? nullptr : *at;
}

bool contains(const CorrelatedList& list, const VeltradSession& session) {
  return std::any_of(list.begin(), list.end(), [&](const auto& listed) { return listed.get() == &session; });
}

std::shared_ptr<VeltradSession> topmostAggregator(std::int32_t hierarchy, const CorrelatedList& list) {
  std::map<std::int32_t, std::shared_ptr<VeltradSession>> firstOfLevel;
  for (const auto& session : list) {
    const std::int32_t level = session->getSessionHierarchy();
    if (level >= 0 && level < hierarchy) firstOfLevel.emplace(level, session);
  }
  for (const auto& [level, session] : firstOfLevel) {
    if (session->hasAggregator()) return session;
  }
  return nullptr;
}

AncestorIDs ancestorIDs(std::int32_t hierarchy, const CorrelatedList& list) {
  AncestorIDs ids;
  for (std::int32_t level = hierarchy - 1; level >= 0; --level) {
    const auto ancestor = getFirstSessionWithHierarchy(level, list);
    if (!ancestor) {
      ids.complete = false;
      return ids;
    }
    ids.text = ids.text.empty() ? ancestor->sessionIDString() : ancestor->sessionIDString() + "." + ids.text;
  }
  return ids;
}

}  // namespace veltrad
