// SPDX-License-Identifier: Apache-2.0
// `veltractl why` and `veltractl watch`: what became of messages, and as it happens. The main thread.
#pragma once

#include "tools/ctl/interrupt.h"
#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Returns the exit status.
int runWhy(const Options& options);
int runWatch(const Options& options, Interrupt& interrupt);

}  // namespace veltrad::ctl
