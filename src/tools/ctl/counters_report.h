// SPDX-License-Identifier: Apache-2.0
// The daemon's counters in readable form.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "base/value.h"

namespace veltrad::ctl {

// The content of run/veltrad/counters.json: {"pid": n, "started": seconds since 1970, "counts": {reason: n}}.
struct CountersReport {
  std::int64_t pid = 0;
  double started = 0;
  Dictionary counts;
};

// Nothing if the text is not such a file.
std::optional<CountersReport> readCounters(std::string_view json);
// A heading, then one line per reason, in order of the reasons. No line break at the end.
std::string formatCounters(const CountersReport& report);

}  // namespace veltrad::ctl
