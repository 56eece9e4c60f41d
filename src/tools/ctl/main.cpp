// SPDX-License-Identifier: Apache-2.0
// veltractl: talks to veltrad through libveltra, like any client.
#include <cstdio>
#include <exception>

#include "tools/ctl/commands.h"
#include "tools/ctl/print.h"

namespace veltrad::ctl {
namespace {

// A command that the daemon alone can answer.
template <typename Run>
int ask(const Options& options, Run run) {
  auto daemon = ControlClient::connect(options.root);
  return daemon ? run(daemon.value(), options) : refused(daemon.error());
}

int runCommand(const Options& options) {
  Interrupt interrupt;
  switch (options.command) {
    case Command::stats:
      return runStats(options);
    case Command::status:
      return runStatus(options, interrupt);
    case Command::doctor:
      return runDoctor(options);
    case Command::metrics:
      return ask(options, runMetrics);
    case Command::config:
    case Command::configGet:
    case Command::configSet:
    case Command::configUnset:
      return runConfig(options);
    case Command::refresh:
      return ask(options, runRefresh);
    case Command::report:
      return runReport(options);
    case Command::why:
      return ask(options, runWhy);
    case Command::watch:
      return ask(options, [&interrupt](ControlClient& daemon, const Options& given) {
        return runWatch(daemon, given, interrupt);
      });
    case Command::privacy:
    case Command::privacyOff:
    case Command::privacyOn:
    case Command::privacyReset:
      return ask(options, runPrivacy);
    case Command::history:
    case Command::historyShow:
    case Command::historyPurge:
      return ask(options, runHistory);
    case Command::spool:
    case Command::spoolSend:
    case Command::spoolDrop:
      return ask(options, runSpool);
    case Command::session:
      return runSession(options, interrupt);
    default:
      return runOneCall(options, interrupt);
  }
}

int run(int argc, char** argv) {
  const auto parsed = parseOptions(argc, argv);
  if (const auto* options = std::get_if<Options>(&parsed)) return runCommand(*options);
  const Ending& ending = std::get<Ending>(parsed);
  std::fputs(ending.output.c_str(), stdout);
  std::fputs(ending.errorOutput.c_str(), stderr);
  return ending.status;
}

}  // namespace
}  // namespace veltrad::ctl

int main(int argc, char** argv) {
  try {
    return veltrad::ctl::run(argc, argv);
  } catch (const std::exception& error) {
    std::fprintf(stderr, "veltractl: %s\n", error.what());
    return 1;
  }
}
