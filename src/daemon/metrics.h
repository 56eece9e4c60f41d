// SPDX-License-Identifier: Apache-2.0
// Formats the daemon's metrics as OpenMetrics text.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

namespace veltrad::platform {
class Counters;
}  // namespace veltrad::platform

namespace veltrad::daemon {

struct Gauges {
  std::size_t sessions = 0;
  std::size_t connections = 0;
  std::size_t postsUnderWay = 0;
  std::uint64_t chargedBytes = 0;  // what is kept for clients
  double started = 0;              // of the process, seconds since 1970
  std::uint64_t spoolPosts = 0;
  std::uint64_t spoolBytes = 0;
};

// Families are "veltrad_…", each with HELP, TYPE and, where it has one, UNIT; the last line is "# EOF". Every
// reason of wire/reasons.def is a sample of veltrad_outcomes, also one that never happened.
std::string metricsText(const platform::Counters& counters, const Gauges& gauges,
                        std::uint64_t residentBytes);

}  // namespace veltrad::daemon
