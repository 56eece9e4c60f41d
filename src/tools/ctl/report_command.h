// SPDX-License-Identifier: Apache-2.0
// `veltractl report`: what helps to find a fault, in one text. The main thread.
#pragma once

#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Prints the report, and with --output writes it to a new file after a question. The exit status: 0, also
// where parts are missing; 1 where it was not written; 2 where nobody can be asked.
int runReport(const Options& options);

}  // namespace veltrad::ctl
