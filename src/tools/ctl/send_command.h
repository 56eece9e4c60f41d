// `veltractl send`, `one-shot`, `states` and `display-url`: one call on a connection of its own. The main
// thread.
#pragma once

#include "tools/ctl/interrupt.h"
#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Prints the answer as one line of JSON. The exit status: 0, or 1 when there was no answer.
int runOneCall(const Options& options, Interrupt& interrupt);

}  // namespace veltrad::ctl
