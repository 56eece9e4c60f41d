// SPDX-License-Identifier: Apache-2.0
// Which posts of the spool are too old, also where the clock was wrong when they were made. Values in,
// verdicts out.
#pragma once

#include <cstdint>
#include <optional>
#include <vector>

namespace veltrad::support {

// A post's age counts from its time (its order, in microseconds since 1970). Where that lies ahead of the
// clock or before kEarliestTime, or the clock shows no time, it counts from when that was noticed. One
// thread.
class SpoolAge {
 public:
  explicit SpoolAge(double secondsKept) : _secondsKept(secondsKept) {}

  // Posts made before this are too old; 0: none is. `now`: the time of day, in seconds; `running`: seconds of
  // a clock that nobody sets and that goes on while the machine sleeps. The orders of the oldest post that is
  // kept and of the newest that was ever made.
  std::uint64_t tooOldBefore(double now, double running, std::uint64_t oldest, std::uint64_t newest);

 private:
  // Posts up to this order, whose days are counted from then on.
  struct Doubted {
    std::uint64_t last = 0;
    double since = 0;
  };

  const double _secondsKept;
  std::optional<Doubted> _doubted;
};

// Gives orders (ascending) that lie ahead of the clock others, close before now, so that the days of their
// posts count from now. Which comes before which stays as it is. Without a clock nothing changes.
void bringBack(std::vector<std::uint64_t>& orders, double now);

}  // namespace veltrad::support
