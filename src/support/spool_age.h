// SPDX-License-Identifier: Apache-2.0
// Decides which posts of the spool are too old, also if the clock was wrong when they were made. Pure
// functions.
#pragma once

#include <cstdint>
#include <optional>
#include <vector>

namespace veltrad::support {

// A post's age counts from its time (its order, in microseconds since 1970). If that time is ahead of the
// clock or before kEarliestTime, or the clock is wrong, the age counts from when this was noticed. One
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

// Replaces orders (ascending) that are ahead of the clock by orders just before now, so that the age of their
// posts counts from now. Their sequence stays the same. If the clock is wrong, nothing changes.
void bringBack(std::vector<std::uint64_t>& orders, double now);

}  // namespace veltrad::support
