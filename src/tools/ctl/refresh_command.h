// SPDX-License-Identifier: Apache-2.0
// `veltractl refresh`. The main thread.
#pragma once

#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Has the daemon fetch one storebag, or each that was asked for since its start, or all where none was. The
// exit status: 0 if all are fetched, else 1.
int runRefresh(const Options& options);

}  // namespace veltrad::ctl
