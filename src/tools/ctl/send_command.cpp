// SPDX-License-Identifier: Apache-2.0
// `veltractl send` and its like: makes one call and prints its answer.
#include "tools/ctl/commands.h"

#include <fmt/format.h>

#include <cstdlib>

#include "platform/file_store.h"
#include "tools/ctl/client_session.h"
#include "tools/ctl/given_values.h"
#include "tools/ctl/print.h"
#include "tools/ctl/upload_report.h"

namespace veltrad::ctl {
namespace {

// Twice the size of the largest call, because the JSON form is longer.
constexpr std::size_t kLargestFile = 128u << 20;

Result<Array, std::string> readLogData(const std::string& path) {
  const auto bytes = platform::DiskFileStore().read(path, kLargestFile);
  if (!bytes) return Failure{bytes.error().description};
  auto data = parseLogData(bytes.value());
  if (!data) return Failure{fmt::format("{}: {}", path, data.error())};
  return data;
}

struct Called {
  Operation operation;
  // Nothing after an interruption.
  std::optional<Answer> answer;
};

Called call(ClientSession& session, const Options& options, const Array& logData) {
  switch (options.command) {
    case Command::send:
      return {Operation::send, session.send(options.category, options.type, options.payload, options.flag)};
    case Command::oneShot:
      return {Operation::oneShot,
              session.sendOneShot(options.identity, options.category, options.type, options.payload)};
    case Command::states:
      return {Operation::states, session.states(options.identity.userInfo)};
    case Command::displayURL:
      return {Operation::displayURL, session.displayURL()};
    case Command::upload:
      return {Operation::uploadFile, session.uploadFile(options.file, uploadProgress(options.file))};
    case Command::uploadLogData:
      return {Operation::uploadLogData, session.uploadLogData(logData)};
    default:
      break;
  }
  // These commands are handled elsewhere.
  std::abort();
}

// Prints why there is no answer.
int failed(const std::optional<Answer>& answer) {
  return refused(answer ? answer->error->description : "Interrupted.");
}

int finishSend(const Options& options, const Answer& answer) {
  if (!printLine(formatSent(answer))) return 1;
  if (answer.status != VELTRA_OK) return failed(answer);
  for (const std::string& line : outcomeLines(answer)) remark(line);
  if (!options.expectReported || reported(answer)) return 0;
  return refused(answer.outcomes ? "No back end reports the message."
                                 : "The daemon is too old to say whether a back end reports the message.");
}

int finish(const Options& options, const Called& called) {
  const auto& [operation, answer] = called;
  if (!answer) return failed(answer);
  if (operation == Operation::send) return finishSend(options, *answer);
  if (!printLine(formatAnswer(operation, *answer))) return 1;
  if (answer->status != VELTRA_OK) return failed(answer);
  if (operation == Operation::uploadFile) return reportUpload(options.file, *answer) ? 0 : 1;
  if (operation != Operation::uploadLogData || answer->uploaded) return 0;
  return refused("Nobody took the log data: see what the daemon's log says.");
}

}  // namespace

int runOneCall(const Options& options, Interrupt& interrupt) {
  ClientSession session(interrupt);
  Array logData;
  if (options.command == Command::uploadLogData) {
    auto read = readLogData(options.file);
    if (!read) return refused(read.error(), 2);
    logData = std::move(read).value();
  }
  const bool oneShot = options.command == Command::oneShot;
  const auto identity = oneShot ? std::nullopt : std::optional(options.identity);
  if (const auto problem = session.open(options.root, identity)) return refused(*problem);
  if (!oneShot) {
    const auto started = session.start();
    if (!started || started->status != VELTRA_OK) return failed(started);
    if (!started->backends)
      complain("Nothing reports for this client: the daemon has no configuration for its client type.");
  }
  return finish(options, call(session, options, logData));
}

}  // namespace veltrad::ctl
