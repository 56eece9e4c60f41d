// SPDX-License-Identifier: Apache-2.0
// Removes files of the spool. One that cannot be removed is counted, and tried again. Any thread.
#pragma once

#include <chrono>
#include <vector>

#include "base/mutex.h"
#include "platform/limited_line.h"
#include "support/spool_folder.h"

namespace veltrad::platform {
class Counters;
}  // namespace veltrad::platform

namespace veltrad::backends {

class SpoolRemovals {
 public:
  using Name = support::SpoolFolder::Name;
  using Time = std::chrono::steady_clock::time_point;

  // Both must outlive it.
  SpoolRemovals(const support::SpoolFolder& folder, platform::Counters& counters)
      : _folder(folder), _counters(counters) {}

  void remove(const Name& name);
  // Tries the remaining files again, at most once a second. Returns whether there are any.
  bool tryAgain(Time now = std::chrono::steady_clock::now());

 private:
  const support::SpoolFolder& _folder;
  platform::Counters& _counters;
  platform::LimitedLine _line{"files"};
  Mutex _mutex LEAF_LOCK{LockRank::leaf};
  std::vector<Name> _left GUARDED_BY(_mutex);
  Time _next GUARDED_BY(_mutex) = {};
};

}  // namespace veltrad::backends
