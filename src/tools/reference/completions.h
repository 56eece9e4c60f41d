// SPDX-License-Identifier: Apache-2.0
// Completions of a command line for the shells, each a complete file.
#pragma once

#include <string>

#include "tools/command_line.h"

namespace veltrad::reference {

std::string bashCompletion(const tools::CommandLine& program);
std::string zshCompletion(const tools::CommandLine& program);
std::string fishCompletion(const tools::CommandLine& program);

}  // namespace veltrad::reference
