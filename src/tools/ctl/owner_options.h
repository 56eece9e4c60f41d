// SPDX-License-Identifier: Apache-2.0
// The commands of veltractl for the owner of a device.
#pragma once

#include "tools/ctl/options.h"

namespace CLI {
class App;
}  // namespace CLI

namespace veltrad::ctl {

// privacy and history.
void addOwner(CLI::App& app, Options& options);

}  // namespace veltrad::ctl
