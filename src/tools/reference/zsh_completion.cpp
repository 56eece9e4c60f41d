// SPDX-License-Identifier: Apache-2.0
// The completion for zsh: a function for each command, which also takes the options of the program.
#include <fmt/format.h>

#include "tools/reference/completions.h"

namespace veltrad::reference {
namespace {

using tools::Argument;
using tools::CommandLine;

// Within single quotes; `special` characters get a backslash.
std::string zshQuoted(std::string_view text, std::string_view special) {
  std::string result;
  for (const char c : text) {
    if (c == '\'') {
      result += "'\\''";
    } else {
      if (special.find(c) != std::string_view::npos) result += '\\';
      result += c == '\n' ? ' ' : c;
    }
  }
  return result;
}

std::string action(const std::string& value, const Argument& argument) {
  if (!argument.choices.empty()) return fmt::format("({})", fmt::join(argument.choices, " "));
  if (value == "FILE") return "_files";
  if (value == "DIR") return "_directories";
  return " ";
}

std::string specOf(const Argument& argument) {
  const std::string value = argument.positional ? argument.names[0] : argument.value;
  if (argument.positional) {
    const char* form = argument.repeated ? "    '*:{}:{}' \\\n" : "    ':{}:{}' \\\n";
    return fmt::format(fmt::runtime(form), zshQuoted(value, ":"), action(value, argument));
  }
  std::string specs;
  for (const std::string& name : argument.names) {
    specs +=
        fmt::format("    '{}{}[{}]", argument.repeated ? "*" : "", name, zshQuoted(argument.help, "[]:\\"));
    if (!value.empty()) specs += fmt::format(":{}:{}", zshQuoted(value, ":"), action(value, argument));
    specs += "' \\\n";
  }
  return specs;
}

std::string functionsOf(const CommandLine& line, const std::string& name, const std::string& everywhere) {
  std::string inner;
  std::string names;
  std::string calls;
  std::string specs = everywhere;
  for (const Argument& argument : line.arguments) specs += specOf(argument);
  for (const CommandLine& command : line.commands) {
    const std::string function = name + "_" + command.name;
    names += fmt::format("    '{}:{}' \\\n", command.name, zshQuoted(command.about, ":\\"));
    calls += fmt::format("        {}) {} ;;\n", command.name, function);
    inner += functionsOf(command, function, everywhere.empty() ? specs : everywhere);
  }
  if (line.commands.empty())
    return fmt::format("{}() {{\n  _arguments -s \\\n{}    && return\n}}\n\n", name, specs);
  return inner + fmt::format(R"({0}() {{
  local context state state_descr line
  typeset -A opt_args
  local -a commands=( \
{2}  )
  _arguments -C -s \
{1}    '1:command:->command' \
    '*::argument:->argument' && return
  case $state in
    command) _describe command commands ;;
    argument)
      case $words[1] in
{3}      esac
      ;;
  esac
}}

)",
                             name, specs, names, calls);
}

}  // namespace

std::string zshCompletion(const CommandLine& program) {
  return fmt::format(
      "#compdef {0}\n# Made from the program's own command line; do not change it by hand.\n\n{1}_{0} "
      "\"$@\"\n",
      program.name, functionsOf(program, "_" + program.name, ""));
}

}  // namespace veltrad::reference
