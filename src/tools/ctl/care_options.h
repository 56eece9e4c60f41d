// SPDX-License-Identifier: Apache-2.0
// The commands of veltractl for those who look after a device.
#pragma once

#include <string>

#include "tools/ctl/options.h"

namespace CLI {
class App;
}  // namespace CLI

namespace veltrad::ctl {

// Adds a command to `app`. When it is given, it becomes the options' command.
CLI::App* addCommand(CLI::App& app, Options& options, Command command, const std::string& name,
                     const std::string& help);

// status, metrics, doctor, config, refresh, report and stats.
void addCare(CLI::App& app, Options& options);

}  // namespace veltrad::ctl
