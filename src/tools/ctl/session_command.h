// `veltractl session`. The main thread.
#pragma once

#include "tools/ctl/interrupt.h"
#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Starts a session, then runs one line after the other. The exit status: 0 at the end of the input or when
// the user interrupts, 1 when the daemon refuses, a call ends without an answer or the connection ends, 2
// when the input cannot be read.
int runSession(const Options& options, Interrupt& interrupt);

}  // namespace veltrad::ctl
