// SPDX-License-Identifier: Apache-2.0
// veltractl: talks to veltrad through libveltra, like any client.
#include <cstdio>
#include <exception>

#include "tools/ctl/config_command.h"
#include "tools/ctl/doctor_command.h"
#include "tools/ctl/history_command.h"
#include "tools/ctl/options.h"
#include "tools/ctl/privacy_command.h"
#include "tools/ctl/refresh_command.h"
#include "tools/ctl/report_command.h"
#include "tools/ctl/send_command.h"
#include "tools/ctl/session_command.h"
#include "tools/ctl/spool_command.h"
#include "tools/ctl/stats_command.h"
#include "tools/ctl/status_command.h"
#include "tools/ctl/why_command.h"

namespace veltrad::ctl {
namespace {

int run(int argc, char** argv) {
  const auto parsed = parseOptions(argc, argv);
  if (const auto* ending = std::get_if<Ending>(&parsed)) {
    std::fputs(ending->output.c_str(), stdout);
    std::fputs(ending->errorOutput.c_str(), stderr);
    return ending->status;
  }
  const Options& options = std::get<Options>(parsed);
  Interrupt interrupt;
  switch (options.command) {
    case Command::stats:
      return runStats(options);
    case Command::status:
      return runStatus(options, interrupt);
    case Command::doctor:
      return runDoctor(options);
    case Command::metrics:
      return runMetrics(options);
    case Command::config:
    case Command::configGet:
    case Command::configSet:
    case Command::configUnset:
      return runConfig(options);
    case Command::refresh:
      return runRefresh(options);
    case Command::report:
      return runReport(options);
    case Command::why:
      return runWhy(options);
    case Command::watch:
      return runWatch(options, interrupt);
    case Command::privacy:
    case Command::privacyOff:
    case Command::privacyOn:
    case Command::privacyReset:
      return runPrivacy(options);
    case Command::history:
    case Command::historyShow:
    case Command::historyPurge:
      return runHistory(options);
    case Command::spool:
    case Command::spoolSend:
    case Command::spoolDrop:
      return runSpool(options);
    case Command::session:
      return runSession(options, interrupt);
    default:
      return runOneCall(options, interrupt);
  }
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
