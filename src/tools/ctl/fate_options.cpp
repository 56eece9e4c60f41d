// SPDX-License-Identifier: Apache-2.0
// The options that select messages.
#include "tools/ctl/command_options.h"

#include <CLI/CLI.hpp>

#include "tools/ctl/option_kinds.h"
#include "wire/fates.h"

namespace veltrad::ctl {
namespace {

constexpr const char* kWhich = "Which messages";

std::string backendProblem(const std::string& text) {
  if (!text.empty()) return {};
  return "expected the name of a back end, such as httppost";
}

void addFilters(CLI::App& command, FateFilter& filter) {
  addNumber(command, "--message", filter.message, "The message with this number")->group(kWhich);
  addNumber(command, "--client-type", filter.clientType, "Of clients of this type")->group(kWhich);
  addNumber(command, "--session-id", filter.sessionID, "Of sessions to which their clients gave this number")
      ->group(kWhich);
  addNumber(command, "--client-version", filter.clientVersion, "Of clients of this version")->group(kWhich);
  addNumber(command, "--category", filter.category, "Of this category")->group(kWhich);
  addNumber(command, "--type", filter.type, "Of this type")->group(kWhich);
  addNumber(command, "--flag", filter.flag, "With this flag")->group(kWhich);
  const auto addText = [&](const std::string& name, std::optional<std::string>& target,
                           const std::string& help) {
    return command.add_option(name, target, help)->type_name("NAME")->group(kWhich);
  };
  addText("--client", filter.client, "Of the client with exactly this name");
  addText("--service", filter.service, "Of the service with exactly this name");
  addText("--backend", filter.backend, "That came to this back end, which alone is shown")
      ->check(CLI::Validator(backendProblem, ""));
  command.add_flag("--uploads", filter.uploads, "Files and log data instead of messages")->group(kWhich);
}

}  // namespace

void addFates(CLI::App& app, Options& options) {
  CLI::App* why =
      addCommand(app, options, Command::why, "why", "Tell what became of messages, and why", kCareGroup);
  addFilters(*why, options.care.fates);
  addNumber(*why, "--last", options.care.last, "At most so many, the newest that fit; 20 without it");
  why->footer(
      "For each message: when, who, category and type, and for each back end its state and why, the whole\n"
      "road, and where the message is now. The daemon keeps a record of bounded size (\"fates\" in\n"
      "settings.json, veltrad(5)) and says what it no longer holds. Contents of messages are not in it, nor "
      "are\n"
      "values of fields, only the names of those that were removed or hashed.\n\n"
      "Examples:\n  veltractl why --client lamp --last 3\n  veltractl why --category 5 --backend httppost "
      "--json");
  CLI::App* watch = addCommand(app, options, Command::watch, "watch",
                               "Tell the same as it happens, until interrupted", kCareGroup);
  addFilters(*watch, options.care.fates);
  watch->add_flag("--contents", options.care.contents,
                  "Also what the messages hold, which needs \"control\"");
  watch->footer(
      "One line for each message and each of its steps. What was overwritten before it could be read is "
      "counted\n"
      "and said. With --contents, payload and user info follow, without what policy.json removes and with "
      "the\n"
      "digests of what it hashes.\n\n"
      "Examples:\n  veltractl watch --client lamp --json\n"
      "  veltractl watch --json --contents >messages.jsonl   # for veltra-storebag explain and diff "
      "--messages");
}

}  // namespace veltrad::ctl
