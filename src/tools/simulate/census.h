// SPDX-License-Identifier: Apache-2.0
// Counts the states of the devices, sampled once a minute.
#pragma once

#include <array>
#include <cstdint>
#include <vector>

#include "base/value.h"

namespace veltrad::simulate {

// Its 12 fields are what is counted.
struct Census {
  // Now.
  std::int64_t on = 0;         // devices
  std::int64_t reporting = 0;  // whose open session reports
  std::int64_t silenced = 0;   // whose open session a server's 5xx has ended
  std::int64_t held = 0;       // events in batches
  std::int64_t keptPosts = 0;  // in spools
  std::int64_t keptEvents = 0;
  std::array<std::int64_t, 256> withBag{};  // devices, by the number of the bag; 0: none
  // Since the last sample.
  std::int64_t sessions = 0;  // begun
  std::int64_t sessionsReporting = 0;
  // Since the start.
  std::int64_t delivered = 0;  // events
  std::int64_t lost = 0;

  struct Sample {
    std::int64_t on, reporting, silenced, held, keptPosts, keptEvents, newest, without, sessions,
        sessionsReporting;
  };
  std::vector<Sample> samples;

  // `newest`: the number of the bag that the server has.
  void sample(std::uint8_t newest);
  // "minutes": an array for each number of a sample; "totals".
  Dictionary report() const;
};

}  // namespace veltrad::simulate
