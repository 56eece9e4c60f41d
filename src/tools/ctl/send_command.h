// `veltractl send`, `one-shot`, `states`, `display-url`, `upload` and `upload-log-data`: one call on a
// connection of its own. The main thread.
#pragma once

#include "tools/ctl/interrupt.h"
#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Prints the answer as one line of JSON. The exit status: 0, 1 when there was no answer or nobody took the
// file or the log data, 2 when the latter's file cannot be read.
int runOneCall(const Options& options, Interrupt& interrupt);

}  // namespace veltrad::ctl
