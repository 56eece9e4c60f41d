// SPDX-License-Identifier: Apache-2.0
// `veltractl doctor`. The main thread.
#pragma once

#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Prints the checks of wire::check::kNames. The exit status: 1 if one of them is a failure, else 0.
int runDoctor(const Options& options);

}  // namespace veltrad::ctl
