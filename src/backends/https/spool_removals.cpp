// SPDX-License-Identifier: Apache-2.0
// Remembers files that could not be removed.
#include "backends/https/spool_removals.h"

#include <utility>

#include "platform/counters.h"
#include "platform/log.h"

namespace veltrad::backends {

void SpoolRemovals::remove(const Name& name) {
  if (_folder.remove(name)) return;
  _counters.count(wire::Reason::spool_file_stays);
  const auto line = _line.happened("A post's file cannot be removed from the spool, and is tried again: " +
                                   support::textOf(name.id));
  if (line) logError("%s", line->c_str());
  const Lock held(_mutex);
  _left.push_back(name);
}

bool SpoolRemovals::tryAgain(Time now) {
  constexpr std::chrono::seconds kApart{1};
  std::vector<Name> left;
  {
    const Lock held(_mutex);
    if (now < _next || _left.empty()) return !_left.empty();
    _next = now + kApart;
    left.swap(_left);
  }
  std::erase_if(left, [this](const Name& name) { return _folder.remove(name); });
  const Lock held(_mutex);
  _left.insert(_left.end(), left.begin(), left.end());
  return !_left.empty();
}

}  // namespace veltrad::backends
