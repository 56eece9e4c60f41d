// `veltractl send`, `one-shot`, `states`, `display-url` and `upload-log-data`: one call on a connection of
// its own. The main thread.
#pragma once

#include "tools/ctl/interrupt.h"
#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Prints the answer as one line of JSON. The exit status: 0, 1 when there was no answer or nobody took log
// data, 2 when its file cannot be read.
int runOneCall(const Options& options, Interrupt& interrupt);

}  // namespace veltrad::ctl
