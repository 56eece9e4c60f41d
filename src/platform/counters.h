// SPDX-License-Identifier: Apache-2.0
// Counts by reason what happens to messages, from any thread and without locks.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <string>

#include "wire/reasons.h"

namespace veltrad::platform {

// The amounts that left the device on a day (UTC).
struct DayAccount {
  std::int64_t day = 0;  // since 1970
  std::uint64_t events = 0;
  std::uint64_t bytes = 0;
};

// The counts of a process, possibly in a file that outlives the process (counts_record.h).
struct Counts {
  // Events that a back end has taken in. Each is later counted under one reason, as posted, lost or dropped.
  std::atomic<std::uint64_t> eventsTaken{0};
  std::array<std::atomic<std::uint64_t>, wire::kReasonCount> ofReason{};
  // Goes on with each process. Who counts it guards it.
  DayAccount day;
};

// The file run/veltrad/counters.json is {"pid": n, "started": seconds since 1970, "counts": {text: n}}, with
// the texts of wire/reasons.def. Counts of 0 are left out.
class Counters {
 public:
  Counters() = default;
  Counters(const Counters&) = delete;

  void count(wire::Reason reason, std::uint64_t times = 1) {
    _counts->ofReason[static_cast<std::size_t>(reason)].fetch_add(times, std::memory_order_relaxed);
  }
  void eventTaken(std::uint64_t events = 1) {
    _counts->eventsTaken.fetch_add(events, std::memory_order_relaxed);
  }
  std::uint64_t value(wire::Reason reason) const {
    return _counts->ofReason[static_cast<std::size_t>(reason)].load(std::memory_order_relaxed);
  }
  // Makes `counts`, which must outlive this, the place of the counters, and continues from its values. To be
  // called before anything is counted and before another thread exists.
  void countIn(Counts& counts) { _counts = &counts; }
  // The sum of all counts. They only grow, so equal sums mean equal counts.
  std::uint64_t total() const;
  // `startedAt` is in seconds since 1970.
  std::string json(double startedAt) const;

 private:
  Counts _own;
  Counts* _counts = &_own;
};

}  // namespace veltrad::platform
