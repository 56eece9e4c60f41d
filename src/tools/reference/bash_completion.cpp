// SPDX-License-Identifier: Apache-2.0
// The completion for bash. A path is that of a command without the program: "/send", "" for none.
#include <fmt/format.h>

#include <algorithm>
#include <vector>

#include "tools/reference/completions.h"

namespace veltrad::reference {
namespace {

using tools::Argument;
using tools::CommandLine;

struct Cases {
  // Patterns and bodies of case statements.
  std::string descents;                                   // from a path and a word to the next path
  std::string words;                                      // by path
  std::string arguments;                                  // whether a command takes files, by path
  std::string choices;                                    // what its first argument may be, by path
  std::vector<std::string> files, directories, anything;  // options by what follows them
};

void note(std::vector<std::string>& names, const Argument& argument) {
  for (const std::string& name : argument.names)
    if (std::find(names.begin(), names.end(), name) == names.end()) names.push_back(name);
}

void collect(const CommandLine& line, const std::string& path, Cases& cases) {
  std::string words;
  bool file = false;
  for (const Argument& argument : line.arguments) {
    if (argument.positional) {
      file = file || argument.names[0] == "FILE";
      if (!argument.choices.empty())
        cases.choices += fmt::format("    {}+0) words=\"{}\" ;;\n", path, fmt::join(argument.choices, " "));
      continue;
    }
    for (const std::string& name : argument.names) words += " " + name;
    if (argument.value == "FILE") note(cases.files, argument);
    if (argument.value == "DIR") note(cases.directories, argument);
    if (!argument.value.empty()) note(cases.anything, argument);
  }
  for (const CommandLine& command : line.commands) {
    words += " " + command.name;
    cases.descents += fmt::format("{}{}+{}", cases.descents.empty() ? "" : " | ", path, command.name);
    collect(command, path + "/" + command.name, cases);
  }
  cases.words += fmt::format("    \"{}\") words=\"{}\" ;;\n", path, words);
  if (file) cases.arguments += fmt::format("{}{}", cases.arguments.empty() ? "" : " | ", path);
}

std::string pattern(const std::vector<std::string>& names) {
  return names.empty() ? "''" : fmt::format("{}", fmt::join(names, " | "));
}

constexpr const char* kFile =
    R"(# bash completion for {0}. Made from the program's own command line; do not change it by hand.
_{0}() {{
  local current=${{COMP_WORDS[COMP_CWORD]}} previous=${{COMP_WORDS[COMP_CWORD - 1]}} path="" words="" given=0 i
  for ((i = 1; i < COMP_CWORD; i++)); do
    case ${{COMP_WORDS[i]}} in
      {1}) ((i++)) ; continue ;;
    esac
    case $path+${{COMP_WORDS[i]}} in
      {2}) path+=/${{COMP_WORDS[i]}} ;;
      *+-*) ;;
      *) ((given++)) ;;
    esac
  done
  COMPREPLY=()
  case $previous in
    {3}) compopt -o filenames; mapfile -t COMPREPLY < <(compgen -f -- "$current"); return ;;
    {4}) compopt -o filenames; mapfile -t COMPREPLY < <(compgen -d -- "$current"); return ;;
    {1}) return ;;
  esac
  case $path in
{5}  esac
  [[ $path == "" ]] || words+="{6}"
  if [[ $current != -* ]]; then
    case $path+$given in
{8}    esac
    case $path in
      {7}) compopt -o filenames; mapfile -t COMPREPLY < <(compgen -f -- "$current"); return ;;
    esac
  fi
  mapfile -t COMPREPLY < <(compgen -W "$words" -- "$current")
}}
complete -F _{0} {0}
)";

}  // namespace

std::string bashCompletion(const CommandLine& program) {
  Cases cases;
  collect(program, "", cases);
  std::string everywhere;
  for (const Argument& argument : program.arguments)
    for (const std::string& name : argument.names)
      if (!argument.positional) everywhere += " " + name;
  return fmt::format(kFile, program.name, pattern(cases.anything), cases.descents, pattern(cases.files),
                     pattern(cases.directories), cases.words, everywhere, cases.arguments, cases.choices);
}

}  // namespace veltrad::reference
