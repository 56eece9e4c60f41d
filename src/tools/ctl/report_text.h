// SPDX-License-Identifier: Apache-2.0
// The text of `veltractl report`. The main thread.
#pragma once

#include <string>

#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Asks the daemon, reads files and runs journalctl. A part that is not available becomes a line that says
// why. Secrets and names of people are removed. No line break at the end.
std::string reportText(const Options& options);

}  // namespace veltrad::ctl
