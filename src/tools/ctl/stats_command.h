// `veltractl stats`. The main thread.
#pragma once

#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Prints the daemon's counters: a table, or the file as it is with --json. The exit status: 0, or 1 when
// there is no daemon; the counts that the last one left are printed all the same.
int runStats(const Options& options);

}  // namespace veltrad::ctl
