// SPDX-License-Identifier: Apache-2.0
// `veltractl status` and `veltractl metrics`. The main thread.
#pragma once

#include <string>

#include "base/result.h"
#include "base/value.h"
#include "tools/ctl/options.h"

namespace veltrad::ctl {

class Interrupt;

// What --json prints, or one line that says why there is nothing.
Result<Dictionary, std::string> askForStatus(const Options& options);

// Prints the status of the running daemon once, or with --watch once a second, in place on a terminal, until
// SIGINT or SIGTERM. The exit status: 0, or 1 where the daemon did not answer.
int runStatus(const Options& options, Interrupt& interrupt);

// Prints the daemon's metrics as OpenMetrics text. The exit status as above.
int runMetrics(const Options& options);

}  // namespace veltrad::ctl
