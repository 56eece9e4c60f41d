// SPDX-License-Identifier: Apache-2.0
// The commands of veltractl. Each returns the exit status: 0; 1 where the daemon cannot be asked or refuses,
// or the output cannot be written; and what else its own comment says. The main thread.
#pragma once

#include <string>

#include "base/result.h"
#include "base/value.h"
#include "tools/ctl/control_client.h"
#include "tools/ctl/interrupt.h"
#include "tools/ctl/options.h"

namespace veltrad::ctl {

// Starts a session, then runs the input lines. 0 at the end of the input or after an interruption; 1 if a
// call ends without an answer, or the connection ends; 2 if the input cannot be read.
int runSession(const Options& options, Interrupt& interrupt);
// send, one-shot, states, display-url, upload and upload-log-data: one call on its own connection, whose
// answer is one line of JSON. 1 if there was no answer, or no server took the file or the log data; 2 if the
// file with the log data cannot be read.
int runOneCall(const Options& options, Interrupt& interrupt);

// Prints the daemon's counters as a table, or the file itself with --json. 1 if no daemon runs; then the
// counts of its last run are printed.
int runStats(const Options& options);
// Prints the status of the running daemon once, or with --watch once a second, in place on a terminal, until
// SIGINT or SIGTERM.
int runStatus(const Options& options, Interrupt& interrupt);
// Prints the daemon's metrics as OpenMetrics text.
int runMetrics(ControlClient& daemon, const Options& options);
// Prints the checks of wire::check::kNames. 1 if one of them is a failure.
int runDoctor(const Options& options);
// config, configGet, configSet and configUnset. 1 where the value is not set, or neither daemon nor files can
// be asked; 2 for an unknown key or a value that it does not take.
int runConfig(const Options& options);
// Has the daemon fetch one storebag, or each that was asked for since its start, or all where none was. 1
// unless all are fetched.
int runRefresh(ControlClient& daemon, const Options& options);
// Prints the report of report_text.h, and with --output writes it to a new file after a question. 1 where it
// was not written, 2 where nobody can be asked.
int runReport(const Options& options);
// spool, spoolSend and spoolDrop: posts that failed and are kept to be sent again.
int runSpool(ControlClient& daemon, const Options& options);

// What became of messages, and the same as it happens.
int runWhy(ControlClient& daemon, const Options& options);
int runWatch(ControlClient& daemon, const Options& options, Interrupt& interrupt);
// privacy, privacyOff, privacyOn and privacyReset. Of privacyOn 1 where the policy still says off.
int runPrivacy(ControlClient& daemon, const Options& options);
// history, historyShow and historyPurge. 1 where there is no such record.
int runHistory(ControlClient& daemon, const Options& options);

// What `report` shows, too: the status as --json prints it, or one line that says why there is none; and the
// answer to "config" for people, without a line break at the end.
Result<Dictionary, std::string> askForStatus(const Options& options);
std::string formatPreferences(const Dictionary& answer);

}  // namespace veltrad::ctl
