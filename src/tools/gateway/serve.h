// SPDX-License-Identifier: Apache-2.0
// The gateway as a process: from its start to SIGTERM.
#pragma once

#include <string>

#include "base/value.h"
#include "tools/gateway/options.h"

namespace veltrad::gateway {

// Blocks SIGTERM and SIGINT, so that only awaitStop() gets them. Before any thread is started.
void blockStopSignals();
// Returns when one of them has come. From then on the process has 14 seconds, and ends after them with status
// 0.
void awaitStop();
// The address of a listener as the line names it.
std::string asURL(const std::string& address);
// Prints one JSON line on standard output, and notifies the service manager.
void sayReady(const Dictionary& line);

// Both return the exit status; if it is not 0, the reason was printed on standard error.
int serve(const Arguments& given);
int drain(const Arguments& given);

}  // namespace veltrad::gateway
