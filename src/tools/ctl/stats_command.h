// SPDX-License-Identifier: Apache-2.0
// `veltractl stats`.
#pragma once

#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Prints the daemon's counters as a table, or the file itself with --json. Returns the exit status: 0, or 1
// if no daemon runs; then the counts of its last run are printed.
int runStats(const Options& options);

}  // namespace veltrad::ctl
