// SPDX-License-Identifier: Apache-2.0
// The command line of veltra-lab.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "tools/command_line.h"

namespace veltrad::lab {

struct Options {
  std::string path = "veltra-lab";
  int port = 8443;
  std::optional<int> dashboardPort;
  int maxAge = 86'400;
  std::vector<std::string> rules;
};

void describe(CLI::App& app, Options& options);

// For the reference pages.
tools::CommandLine commandLine();

}  // namespace veltrad::lab
