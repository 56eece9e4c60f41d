// SPDX-License-Identifier: Apache-2.0
// `veltractl privacy`. The main thread.
#pragma once

#include "tools/ctl/options.h"

namespace veltrad::ctl {

// privacy, privacyOff, privacyOn and privacyReset. The exit status: 0; 1 where the daemon cannot be asked or
// refuses, and of privacyOn where the policy still says off.
int runPrivacy(const Options& options);

}  // namespace veltrad::ctl
