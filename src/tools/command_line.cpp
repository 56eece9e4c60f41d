// SPDX-License-Identifier: Apache-2.0
// Reads the description of a command line from CLI11.
#include "tools/command_line.h"

#include <CLI/CLI.hpp>
#include <memory>
#include <tuple>

namespace veltrad::tools {
namespace {

constexpr const char* kUsualGroup = "Options";

// As help writes it, in which a program may have changed it.
std::string positionalName(const CLI::App& app, const CLI::Option& option) {
  const auto* formatter = dynamic_cast<const CLI::Formatter*>(app.get_formatter().get());
  return formatter ? formatter->make_option_name(&option, true) : option.get_name();
}

// CLI11 says both in one text: "INT:INT in [0 - 65535]".
std::pair<std::string, std::string> valueAndRange(const CLI::Option& option) {
  const std::string type = option.get_type_name();
  const std::size_t open = type.find('[');
  const std::size_t close = type.find(']');
  const bool ranged = open != std::string::npos && close != std::string::npos && open < close;
  return {type.substr(0, type.find(':')), ranged ? type.substr(open + 1, close - open - 1) : ""};
}

Argument argumentOf(const CLI::App& app, const CLI::Option& option) {
  Argument argument;
  argument.positional = option.get_positional();
  if (argument.positional) argument.names.push_back(positionalName(app, option));
  for (const std::string& name : option.get_snames()) argument.names.push_back("-" + name);
  for (const std::string& name : option.get_lnames()) argument.names.push_back("--" + name);
  if (option.get_items_expected_max() > 0) std::tie(argument.value, argument.range) = valueAndRange(option);
  if (option.get_group() != kUsualGroup) argument.group = option.get_group();
  argument.help = option.get_description();
  argument.byDefault = option.get_default_str();
  argument.required = option.get_required();
  argument.repeated = option.get_items_expected_max() > 1;
  return argument;
}

// CLI11 would write "--port INT:INT in [0 - 65535]=8443" and "FILE TEXT REQUIRED".
class ManualStyle : public CLI::Formatter {
 public:
  ManualStyle() {
    label("SUBCOMMAND", "COMMAND");
    label("Positionals", "Arguments");
  }
  std::string make_option_opts(const CLI::Option* option) const override {
    return option->get_positional() || option->get_items_expected_max() == 0
               ? ""
               : " " + valueAndRange(*option).first;
  }
  std::string make_option_desc(const CLI::Option* option) const override {
    const std::string range = valueAndRange(*option).second;
    const std::string byDefault = option->get_default_str();
    return option->get_description() + (range.empty() ? "" : " (" + range + ")") +
           (byDefault.empty() ? "" : " [" + byDefault + "]") +
           (option->get_required() && !option->get_positional() ? " (required)" : "");
  }
};

}  // namespace

void useManualStyle(CLI::App& app) {
  app.formatter(std::make_shared<ManualStyle>());
  app.set_help_flag("-h,--help", "Print this help");
}

CommandLine commandLineOf(const CLI::App& app) {
  CommandLine line{app.get_name(), app.get_description(), app.get_footer(), app.get_group(), {}, {}};
  for (const CLI::Option* option : app.get_options())
    if (app.get_parent() == nullptr || option != app.get_help_ptr())
      line.arguments.push_back(argumentOf(app, *option));
  for (const CLI::App* command : app.get_subcommands({})) line.commands.push_back(commandLineOf(*command));
  return line;
}

}  // namespace veltrad::tools
