// SPDX-License-Identifier: Apache-2.0
// `veltractl config`. The main thread.
#pragma once

#include <string>

#include "base/value.h"
#include "tools/ctl/options.h"

namespace veltrad::ctl {

// config, configGet, configSet and configUnset. The exit status: 0; 1 where the value is not set, or neither
// daemon nor files can be asked; 2 for an unknown key or a value that it does not take.
int runConfig(const Options& options);

// The answer to "config" for people. No line break at the end.
std::string formatPreferences(const Dictionary& answer);

}  // namespace veltrad::ctl
