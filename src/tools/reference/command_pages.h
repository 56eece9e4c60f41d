// SPDX-License-Identifier: Apache-2.0
// Generates the parts of manual pages about options and commands.
#pragma once

#include <string>

#include "tools/command_line.h"

namespace veltrad::reference {

// The options that stand before a command, or of a program without commands.
std::string optionsOf(const tools::CommandLine& program);
// All commands with their options. Options of a group of their own, which several commands share, follow at
// the end.
std::string commandsOf(const tools::CommandLine& program);

}  // namespace veltrad::reference
