// SPDX-License-Identifier: Apache-2.0
// `veltractl spool`: posts that failed and are kept to be sent again.
#pragma once

#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Returns the exit status.
int runSpool(const Options& options);

}  // namespace veltrad::ctl
