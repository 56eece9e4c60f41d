// SPDX-License-Identifier: Apache-2.0
// Counts by reason what happens to messages, from any thread and without locks.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <string>

#include "wire/reasons.h"

namespace veltrad::platform {

// The file run/veltrad/counters.json is {"pid": n, "started": seconds since 1970, "counts": {text: n}}, with
// the texts of wire/reasons.def. Counts of 0 are left out.
class Counters {
 public:
  void count(wire::Reason reason, std::uint64_t times = 1) {
    _counts[static_cast<std::size_t>(reason)].fetch_add(times, std::memory_order_relaxed);
  }
  std::uint64_t value(wire::Reason reason) const {
    return _counts[static_cast<std::size_t>(reason)].load(std::memory_order_relaxed);
  }
  // Of all counts. They only grow, so equal totals mean equal counts.
  std::uint64_t total() const;
  // `startedAt` is in seconds since 1970.
  std::string json(double startedAt) const;

 private:
  std::array<std::atomic<std::uint64_t>, wire::kReasonCount> _counts{};
};

}  // namespace veltrad::platform
