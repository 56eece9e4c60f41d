// SPDX-License-Identifier: Apache-2.0
// Generates the parts of manual pages about options and commands.
#include "tools/reference/command_pages.h"

#include <fmt/format.h>

#include <algorithm>
#include <vector>

#include "base/text.h"
#include "tools/reference/markdown.h"

namespace veltrad::reference {
namespace {

using tools::Argument;
using tools::CommandLine;

// "**-o**, **--output** *FILE*"
std::string form(const Argument& argument) {
  std::string text;
  for (const std::string& name : argument.names)
    text += fmt::format("{}{}{}{}", text.empty() ? "" : ", ", argument.positional ? "*" : "**", escaped(name),
                        argument.positional ? "*" : "**");
  if (!argument.positional && !argument.value.empty()) text += fmt::format(" *{}*", escaped(argument.value));
  return text;
}

std::string item(const Argument& argument) {
  std::string help = argument.help;
  std::replace(help.begin(), help.end(), '\n', ' ');
  std::string line = fmt::format("- {}: {}", form(argument), sentence(escaped(help)));
  if (!argument.range.empty()) line += fmt::format(" Range: {}.", argument.range);
  if (!argument.byDefault.empty()) line += fmt::format(" Default: {}.", escaped(argument.byDefault));
  if (argument.required && !argument.positional) line += " Required.";
  return line + '\n';
}

std::string itemsOf(const CommandLine& line, const std::string& group) {
  std::string items;
  for (const Argument& argument : line.arguments)
    if (argument.group == group) items += item(argument);
  return items;
}

// "**veltractl send** **--category** *N* [*OPTION*…] [*KEY=VALUE*…]"
std::string usage(const CommandLine& line, const std::string& path) {
  std::string required;
  std::string positional;
  for (const Argument& argument : line.arguments) {
    const std::string text = form(argument) + (argument.repeated && argument.positional ? "…" : "");
    if (argument.positional)
      positional += argument.required ? " " + text : fmt::format(" \\[{}\\]", text);
    else if (argument.required)
      required += " " + text;
  }
  return fmt::format("**{}**{} \\[*OPTION*…\\]{}\n", path, required, positional);
}

using Groups = std::vector<std::pair<std::string, const CommandLine*>>;

// The groups of options of `line`, which are recorded at the first command that has them.
std::string groupsOf(const CommandLine& line, Groups& groups) {
  std::string names;
  for (const Argument& argument : line.arguments) {
    if (argument.group.empty() || names.find(argument.group) != std::string::npos) continue;
    names += (names.empty() ? "" : ", ") + argument.group;
    bool known = false;
    for (const auto& [group, first] : groups) known = known || group == argument.group;
    if (!known) groups.emplace_back(argument.group, &line);
  }
  return names;
}

std::string commandsBelow(const CommandLine& line, const std::string& path, Groups& groups) {
  std::string page;
  for (const CommandLine& command : line.commands) {
    const std::string here = path + " " + command.name;
    page += fmt::format("### {}\n\n{}\n{}\n", here, usage(command, here), sentence(escaped(command.about)));
    if (const std::string items = itemsOf(command, ""); !items.empty()) page += '\n' + items;
    if (const std::string names = groupsOf(command, groups); !names.empty())
      page += fmt::format("\nIt also takes the {} options, see below.\n", lowerCase(names));
    if (!command.footer.empty()) page += '\n' + prose(command.footer);
    page += '\n' + commandsBelow(command, here, groups);
  }
  return page;
}

}  // namespace

std::string optionsOf(const CommandLine& program) {
  return itemsOf(program, "");
}

std::string commandsOf(const CommandLine& program) {
  Groups groups;
  std::string page = commandsBelow(program, program.name, groups);
  for (const auto& [group, command] : groups)
    page += fmt::format("### {} options\n\n{}\n", group, itemsOf(*command, group));
  page.pop_back();
  return page;
}

}  // namespace veltrad::reference
