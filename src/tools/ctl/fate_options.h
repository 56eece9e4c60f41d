// SPDX-License-Identifier: Apache-2.0
// The options of `veltractl why` and `watch`.
#pragma once

#include "tools/ctl/options.h"

namespace CLI {
class App;
}  // namespace CLI

namespace veltrad::ctl {

void addFates(CLI::App& app, Options& options);

}  // namespace veltrad::ctl
