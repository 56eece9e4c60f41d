// SPDX-License-Identifier: Apache-2.0
// The options of veltractl's commands for administrators.
#include "tools/ctl/command_options.h"

#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <charconv>
#include <vector>

#include "base/text.h"
#include "tools/ctl/option_kinds.h"

namespace veltrad::ctl {

// The callbacks of its own commands run before.
CLI::App* addCommand(CLI::App& app, Options& options, Command command, const std::string& name,
                     const std::string& help, const char* group) {
  CLI::App* added = app.add_subcommand(name, help)->group(group);
  added->final_callback([&options, command, added] {
    if (added->get_subcommands().empty()) options.command = command;
  });
  return added;
}

namespace {

std::string clientTypeProblem(const std::string& text) {
  std::int32_t type = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), type);
  if (error == std::errc() && end == text.data() + text.size() && type >= 0) return {};
  return fmt::format("expected a client type, 0 to 17, found \"{}\"", escapedForLog(text));
}

void addDoctor(CLI::App& app, Options& options) {
  CLI::App* doctor =
      addCommand(app, options, Command::doctor, "doctor",
                 "Check everything that stands between this device and its first report", kCareGroup);
  doctor
      ->add_option(
          "--client-type", options.care.clientTypes,
          "Look at this client type's storebag; repeat the option for more. Without it at those that\n"
          "sessions have asked for since the start, else at all")
      ->type_name("N")
      ->check(CLI::Validator(clientTypeProblem, ""));
  doctor->footer(
      "Prints each check with ok, warning, failure or skipped, and what to do. The exit status is 1 exactly "
      "if\n"
      "there is a failure. Storebags are fetched anew, and what comes is used for nothing else.\n\n"
      "Examples:\n  veltractl doctor\n  veltractl doctor --client-type 7 --json");
}

void addConfig(CLI::App& app, Options& options) {
  Care& care = options.care;
  CLI::App* config = addCommand(app, options, Command::config, "config",
                                "Show or change the preferences that the system reads", kCareGroup);
  config->require_subcommand(0, 1);
  const auto addKey = [&](CLI::App* command) {
    addArgument(*command, "key", care.key, "Name of a preference, as `veltractl config` shows it");
  };
  addKey(addCommand(*config, options, Command::configGet, "get", "Print the value alone"));
  CLI::App* set = addCommand(*config, options, Command::configSet, "set", "Store a value");
  addKey(set);
  addArgument(*set, "value", care.value, "true, false, a number, or a text, as the key's type says");
  addKey(addCommand(*config, options, Command::configUnset, "unset",
                    "Take a value away; the default holds again"));
  config->footer(
      "Without a command, all preferences are shown. While no daemon runs, their files are read and written\n"
      "directly. The exit status of get is 1 where the key is not set; a wrong key or value is a usage "
      "error.\n\n"
      "Examples:\n  veltractl config set DiagnosticLogSubmissionEnabled true\n"
      "  veltractl config get com.florn.timed/TMAutomaticTimeZoneEnabled");
}

void addRefreshAndReport(CLI::App& app, Options& options) {
  CLI::App* refresh = addCommand(app, options, Command::refresh, "refresh",
                                 "Fetch storebags now and say what came of it", kCareGroup);
  refresh
      ->add_option("name", options.care.key,
                   "A storebag; without it those asked for since the start, else all")
      ->type_name("");
  refresh->footer(
      "Asks the server also when the last attempt has just failed, and never \"only if modified\". The exit\n"
      "status is 1 if a storebag was not fetched.\n\nExamples:\n  veltractl refresh\n"
      "  veltractl refresh quindle --json");
  CLI::App* report = addCommand(app, options, Command::report, "report",
                                "Print all that helps to find a fault, to be passed on", kCareGroup);
  report->add_option("-o,--output", options.care.output, "Also write it to FILE, a new one, mode 0600")
      ->type_name("FILE");
  report->add_flag("--yes", options.care.yes, "Write it without a question");
  report->footer(
      "Status, checks, counters, configuration, versions and the last lines of the log. Secrets, "
      "identifiers,\n"
      "names of people and their addresses are left out; read it before you pass it on.\n"
      "With --output it is shown first, and then asked whether to write it; without a terminal to ask on,\n"
      "--yes is required.\n\nExample:\n  veltractl report --output veltra-report.txt");
}

void addSpool(CLI::App& app, Options& options) {
  CLI::App* spool = addCommand(app, options, Command::spool, "spool",
                               "Show the posts that failed and are kept to be sent again", kCareGroup);
  spool->require_subcommand(0, 1);
  addCommand(*spool, options, Command::spool, "list", "The same as without a command");
  addCommand(*spool, options, Command::spoolSend, "send",
             "Send them now: no address waits, whatever its server has asked for");
  addArgument(*addCommand(*spool, options, Command::spoolDrop, "drop", "Remove posts for good, unsent"), "id",
              options.care.ids, "Posts, as `veltractl spool` shows them");
  spool->footer(
      "Kept only if \"spool\" in etc/veltrad/settings.json says so. Oldest first; with --json one object a "
      "line.\n\nExamples:\n  veltractl spool\n  veltractl spool send");
}

}  // namespace

void addCare(CLI::App& app, Options& options) {
  CLI::App* status = addCommand(app, options, Command::status, "status",
                                "Show the running daemon, its sessions, storebags and servers", kCareGroup);
  status->add_flag("--watch", options.care.watch, "Show it anew every second, until interrupted");
  status->footer("Examples:\n  veltractl status --watch\n  veltractl status --json");
  addCommand(app, options, Command::metrics, "metrics", "Print the daemon's metrics as OpenMetrics text",
             kCareGroup)
      ->footer("The daemon keeps the same text in run/veltrad/metrics.prom.");
  addFates(app, options);
  addConfig(app, options);
  addRefreshAndReport(app, options);
  addSpool(app, options);
  addDoctor(app, options);
  CLI::App* stats = addCommand(app, options, Command::stats, "stats",
                               "Show what happened to messages, by reason, with counts", kCareGroup);
  stats->footer("Examples:\n  veltractl stats\n  veltractl stats --json");
}

}  // namespace veltrad::ctl
