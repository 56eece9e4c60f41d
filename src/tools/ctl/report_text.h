// SPDX-License-Identifier: Apache-2.0
// The text of `veltractl report`. The main thread.
#pragma once

#include <string>

#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Asks the daemon, reads files and runs journalctl. A part that cannot be had is a line that says why. What
// is secret or names people is not in it. No line break at the end.
std::string reportText(const Options& options);

}  // namespace veltrad::ctl
