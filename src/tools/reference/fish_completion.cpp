// SPDX-License-Identifier: Apache-2.0
// The completion for fish: a line for each command and option.
#include <fmt/format.h>

#include "tools/reference/completions.h"

namespace veltrad::reference {
namespace {

using tools::Argument;
using tools::CommandLine;

std::string fishQuoted(std::string_view text) {
  std::string result = "'";
  for (const char c : text) {
    if (c == '\'' || c == '\\') result += '\\';
    result += c == '\n' ? ' ' : c;
  }
  return result + "'";
}

std::string kindOf(const std::string& value) {
  if (value == "FILE") return " -r -F";
  if (value == "DIR") return " -x -a '(__fish_complete_directories)'";
  return value.empty() ? "" : " -x";
}

std::string optionLine(const std::string& start, const Argument& argument) {
  std::string names;
  for (const std::string& name : argument.names)
    names += name.starts_with("--") ? " -l " + name.substr(2) : " -s " + name.substr(1);
  return fmt::format("{}{}{} -d {}\n", start, names, kindOf(argument.value), fishQuoted(argument.help));
}

// Offered until one of them has been typed.
std::string choicesLine(const std::string& complete, const std::string& condition, const Argument& argument) {
  const std::string choices = fmt::format("{}", fmt::join(argument.choices, " "));
  const std::string until = condition + "; and not __fish_seen_subcommand_from " + choices;
  return fmt::format("{} -n {} -a {} -d {}\n", complete, fishQuoted(until), fishQuoted(choices),
                     fishQuoted(argument.help));
}

// `condition` holds once the command has been typed.
std::string linesOf(const CommandLine& line, const std::string& complete, const std::string& condition) {
  std::string lines;
  const std::string start = condition.empty() ? complete : complete + " -n " + fishQuoted(condition);
  for (const Argument& argument : line.arguments) {
    if (!argument.positional)
      lines += optionLine(start, argument);
    else if (argument.names[0] == "FILE")
      lines += start + " -F\n";
    else if (!argument.choices.empty())
      lines += choicesLine(complete, condition, argument);
  }
  std::string names;
  for (const CommandLine& command : line.commands) names += " " + command.name;
  const std::string before = condition.empty() ? "" : condition + "; and ";
  for (const CommandLine& command : line.commands) {
    lines += fmt::format("{} -n {} -a {} -d {}\n", complete,
                         fishQuoted(fmt::format("{}not __fish_seen_subcommand_from{}", before, names)),
                         command.name, fishQuoted(command.about));
    lines +=
        linesOf(command, complete, fmt::format("{}__fish_seen_subcommand_from {}", before, command.name));
  }
  return lines;
}

}  // namespace

std::string fishCompletion(const CommandLine& program) {
  const std::string complete = "complete -c " + program.name;
  return "# Made from the program's own command line; do not change it by hand.\n" + complete + " -f\n" +
         linesOf(program, complete, "");
}

}  // namespace veltrad::reference
