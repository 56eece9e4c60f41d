// SPDX-License-Identifier: Apache-2.0
// `veltractl session`.
#pragma once

#include "tools/ctl/interrupt.h"
#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Starts a session, then runs the input lines. Returns the exit status: 0 at the end of the input or after an
// interruption; 1 if the daemon refuses, a call ends without an answer, or the connection ends; 2 if the
// input cannot be read.
int runSession(const Options& options, Interrupt& interrupt);

}  // namespace veltrad::ctl
