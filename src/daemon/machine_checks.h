// SPDX-License-Identifier: Apache-2.0
// The checks of `veltractl doctor` that concern the machine and its owner, not the way to a storebag. Pure
// functions; any thread.
#pragma once

#include <vector>

#include "daemon/diagnosis.h"

namespace veltrad::daemon {

// consent, messageLog, sandbox, descriptors, clock.
void addMachineChecks(const MachineFacts& facts, std::vector<Check>& checks);

}  // namespace veltrad::daemon
