// SPDX-License-Identifier: Apache-2.0
// Describes the commands for the owner of a device.
#include "tools/ctl/command_options.h"

#include "tools/ctl/option_kinds.h"

namespace veltrad::ctl {
namespace {

constexpr const char* kOwnerGroup = "For the owner of a device";

void addPrivacy(CLI::App& app, Options& options) {
  CLI::App* privacy =
      addCommand(app, options, Command::privacy, "privacy",
                 "Show what may leave the device and what left, or stop all reporting", kOwnerGroup);
  privacy->require_subcommand(0, 1);
  addCommand(*privacy, options, Command::privacyOff, "off",
             "Stop all reporting now, and say what was dropped; outlives a restart");
  addCommand(*privacy, options, Command::privacyOn, "on", "Let back ends report again, if the policy does");
  addCommand(*privacy, options, Command::privacyReset, "reset-identifiers",
             "Forget the identifiers of this device and its secret, and make others");
  privacy->footer(
      "Without a command: whether anything is reported, the consent, the policy, the identifiers with their "
      "age,\nand what left in the last day by destination. `off` also says what is under way, which is ended "
      "within a\nsecond, and what is on disk. The exit status of `on` is 1 if the policy still forbids "
      "reporting.\n\nExamples:\n  veltractl privacy\n  veltractl privacy off --json");
}

void addHistory(CLI::App& app, Options& options) {
  Care& care = options.care;
  CLI::App* history = addCommand(app, options, Command::history, "history",
                                 "Show what left the device, exactly as it left", kOwnerGroup);
  history->require_subcommand(0, 1);
  history->add_option("--html", care.html, "Write it as a page for a browser to FILE, a new one, mode 0600")
      ->type_name("FILE");
  CLI::App* show = addCommand(*history, options, Command::historyShow, "show",
                              "Print the headers and the readable body of one record");
  addArgument(*show, "id", care.key, "A record, as `veltractl history` shows it");
  show->add_flag("--raw", care.raw, "Print the bytes as they left, and nothing else");
  addCommand(*history, options, Command::historyPurge, "purge",
             "Remove all of it for good, and say how much");
  history->footer(
      "Kept only if \"history\" in etc/veltrad/policy.json says so. Oldest first; with --json one object a "
      "line.\n\nExamples:\n  veltractl history\n  veltractl history show 6441a1b2c3d4e --raw | zcat\n"
      "  veltractl history --html history.html");
}

}  // namespace

void addOwner(CLI::App& app, Options& options) {
  addPrivacy(app, options);
  addHistory(app, options);
}

}  // namespace veltrad::ctl
