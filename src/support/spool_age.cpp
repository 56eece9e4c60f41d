// SPDX-License-Identifier: Apache-2.0
// Counts days by the clock, or by the time that has passed.
#include "support/spool_age.h"

#include "base/version.h"

namespace veltrad::support {

namespace {
constexpr double kPerSecond = 1e6;
}  // namespace

std::uint64_t SpoolAge::tooOldBefore(double now, double running, std::uint64_t oldest, std::uint64_t newest) {
  const double made = static_cast<double>(oldest) / kPerSecond;
  if (now >= kEarliestTime && made >= kEarliestTime && made <= now) {
    _doubted.reset();
    return now > _secondsKept ? static_cast<std::uint64_t>((now - _secondsKept) * kPerSecond) : 0;
  }
  if (!_doubted || oldest > _doubted->last) _doubted = {newest, running};
  return running - _doubted->since < _secondsKept ? 0 : _doubted->last + 1;
}

void bringBack(std::vector<std::uint64_t>& orders, double now) {
  if (now < kEarliestTime) return;
  auto latest = static_cast<std::uint64_t>(now * kPerSecond);
  for (auto order = orders.rbegin(); order != orders.rend() && *order > latest; ++order) *order = latest--;
}

}  // namespace veltrad::support
