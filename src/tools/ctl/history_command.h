// SPDX-License-Identifier: Apache-2.0
// `veltractl history`. The main thread.
#pragma once

#include "tools/ctl/options.h"

namespace veltrad::ctl {

// history, historyShow and historyPurge. The exit status: 0; 1 where the daemon cannot be asked, or there is
// no such record.
int runHistory(const Options& options);

}  // namespace veltrad::ctl
