// SPDX-License-Identifier: Apache-2.0
// The parts that the command line of veltractl is put together from.
#pragma once

#include <string>

#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Adds a command to `app`, under a heading of its help. When it is given, and none of the commands that it
// has itself, it becomes the options' command.
CLI::App* addCommand(CLI::App& app, Options& options, Command command, const std::string& name,
                     const std::string& help, const char* group = "Commands");

inline constexpr const char* kCareGroup = "Looking after a device";

// status, metrics, doctor, config, refresh, report, spool and stats.
void addCare(CLI::App& app, Options& options);
// why and watch.
void addFates(CLI::App& app, Options& options);
// privacy and history.
void addOwner(CLI::App& app, Options& options);

}  // namespace veltrad::ctl
