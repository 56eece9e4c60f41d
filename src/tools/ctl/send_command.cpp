// `veltractl send`, `one-shot`, `states`, `display-url`, `upload` and `upload-log-data`: one call on a
// connection of its own. The main thread.
#include "tools/ctl/send_command.h"

#include <fmt/format.h>

#include "platform/file_store.h"
#include "tools/ctl/client_session.h"
#include "tools/ctl/given_values.h"
#include "tools/ctl/print.h"
#include "tools/ctl/upload_report.h"

namespace veltrad::ctl {
namespace {

// Twice what the largest call has: JSON is the longer form.
constexpr std::size_t kLargestFile = 128u << 20;

Operation operationOf(Command command) {
  switch (command) {
    case Command::states:
      return Operation::states;
    case Command::displayURL:
      return Operation::displayURL;
    case Command::upload:
      return Operation::uploadFile;
    case Command::uploadLogData:
      return Operation::uploadLogData;
    default:
      return Operation::send;
  }
}

Result<Array, std::string> readLogData(const std::string& path) {
  const auto bytes = platform::DiskFileStore().read(path, kLargestFile);
  if (!bytes) return Failure{bytes.error().description};
  auto data = parseLogData(bytes.value());
  if (!data) return Failure{fmt::format("{}: {}", path, data.error())};
  return data;
}

std::optional<Answer> call(ClientSession& session, const Options& options, const Array& logData) {
  switch (operationOf(options.command)) {
    case Operation::states:
      return session.states(options.identity.userInfo);
    case Operation::displayURL:
      return session.displayURL();
    case Operation::uploadFile:
      return session.uploadFile(options.file, uploadProgress(options.file));
    case Operation::uploadLogData:
      return session.uploadLogData(logData);
    default:
      return session.send(options.category, options.type, options.payload, options.flag);
  }
}

// Says why there is no answer.
int failed(const std::optional<Answer>& answer) {
  complain(answer ? answer->error->description : "Interrupted.");
  return 1;
}

int finish(Operation operation, const Options& options, const std::optional<Answer>& answer) {
  if (!answer) return failed(answer);
  if (!printLine(formatAnswer(operation, *answer))) return 1;
  if (answer->status != VELTRA_OK) return failed(answer);
  if (operation == Operation::uploadFile) return reportUpload(options.file, *answer) ? 0 : 1;
  if (operation != Operation::uploadLogData || answer->uploaded) return 0;
  complain("Nobody took the log data: see what the daemon's log says.");
  return 1;
}

int runOneShot(const Options& options, ClientSession& session) {
  if (const auto problem = session.openUndescribed(options.root)) {
    complain(*problem);
    return 1;
  }
  return finish(Operation::oneShot, options,
                session.sendOneShot(options.identity, options.category, options.type, options.payload));
}

}  // namespace

int runOneCall(const Options& options, Interrupt& interrupt) {
  ClientSession session(interrupt);
  if (options.command == Command::oneShot) return runOneShot(options, session);
  Array logData;
  if (options.command == Command::uploadLogData) {
    auto read = readLogData(options.file);
    if (!read) {
      complain(read.error());
      return 2;
    }
    logData = std::move(read).value();
  }
  if (const auto problem = session.open(options.root, options.identity)) {
    complain(*problem);
    return 1;
  }
  const auto started = session.start();
  if (!started || started->status != VELTRA_OK) return failed(started);
  if (!started->backends)
    complain("Nothing reports for this client: the daemon has no configuration for its client type.");
  return finish(operationOf(options.command), options, call(session, options, logData));
}

}  // namespace veltrad::ctl
