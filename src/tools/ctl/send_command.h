// SPDX-License-Identifier: Apache-2.0
// `veltractl send`, `one-shot`, `states`, `display-url`, `upload` and `upload-log-data`: one call on its own
// connection.
#pragma once

#include "tools/ctl/interrupt.h"
#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Prints the answer as one line of JSON. Returns the exit status: 0; 1 if there was no answer, or no server
// took the file or the log data; 2 if the file with the log data cannot be read.
int runOneCall(const Options& options, Interrupt& interrupt);

}  // namespace veltrad::ctl
