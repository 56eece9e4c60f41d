// The daemon's counters for a person. Pure functions; any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "base/value.h"

namespace veltrad::ctl {

// What run/veltrad/counters.json holds: {"pid": n, "started": seconds since 1970, "counts": {reason: n}}.
struct CountersReport {
  std::int64_t pid = 0;
  double started = 0;
  Dictionary counts;
};

// Nothing when the text is no such file.
std::optional<CountersReport> readCounters(std::string_view json);
// A heading, then one line for each reason, in order of the reasons. No line break at the end.
std::string formatCounters(const CountersReport& report);

}  // namespace veltrad::ctl
