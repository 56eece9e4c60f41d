// SPDX-License-Identifier: Apache-2.0
// A command line as data, from which help pages and completions are made.
#pragma once

#include <string>
#include <vector>

namespace CLI {
class App;
}

namespace veltrad::tools {

struct Argument {
  // "-o", "--output"; of a positional argument one name, as help shows it: "FILE".
  std::vector<std::string> names;
  // The placeholder of an option's value: "DIR", "N"; empty if it has no value.
  std::string value;
  // "0 - 65535"; empty: help says what is allowed.
  std::string range;
  // The heading under which help shows it; empty for the usual one.
  std::string group;
  std::string help;
  std::string byDefault;
  // The possible values, for completions.
  std::vector<std::string> choices;
  bool positional = false;
  bool required = false;
  bool repeated = false;
};

struct CommandLine {
  std::string name;
  std::string about;
  std::string footer;
  std::string group;
  std::vector<Argument> arguments;
  std::vector<CommandLine> commands;
};

// Help shows commands, values, ranges and defaults as manual pages do. Before commands are added.
void useManualStyle(CLI::App& app);

// Without the help option of commands.
CommandLine commandLineOf(const CLI::App& app);

}  // namespace veltrad::tools
