// `veltractl send`, `one-shot`, `states` and `display-url`: one call on a connection of its own. The main
// thread.
#include "tools/ctl/send_command.h"

#include "tools/ctl/client_session.h"
#include "tools/ctl/print.h"

namespace veltrad::ctl {
namespace {

Operation operationOf(Command command) {
  if (command == Command::states) return Operation::states;
  return command == Command::displayURL ? Operation::displayURL : Operation::send;
}

std::optional<Answer> call(ClientSession& session, const Options& options) {
  switch (operationOf(options.command)) {
    case Operation::states:
      return session.states(options.identity.userInfo);
    case Operation::displayURL:
      return session.displayURL();
    default:
      return session.send(options.category, options.type, options.payload, options.flag);
  }
}

// Says why there is no answer.
int failed(const std::optional<Answer>& answer) {
  complain(answer ? answer->error->description : "Interrupted.");
  return 1;
}

int finish(Operation operation, const std::optional<Answer>& answer) {
  if (!answer) return failed(answer);
  if (!printLine(formatAnswer(operation, *answer))) return 1;
  return answer->status == VELTRA_OK ? 0 : failed(answer);
}

int runOneShot(const Options& options, ClientSession& session) {
  if (const auto problem = session.openUndescribed(options.root)) {
    complain(*problem);
    return 1;
  }
  return finish(Operation::oneShot,
                session.sendOneShot(options.identity, options.category, options.type, options.payload));
}

}  // namespace

int runOneCall(const Options& options, Interrupt& interrupt) {
  ClientSession session(interrupt);
  if (options.command == Command::oneShot) return runOneShot(options, session);
  if (const auto problem = session.open(options.root, options.identity)) {
    complain(*problem);
    return 1;
  }
  const auto started = session.start();
  if (!started || started->status != VELTRA_OK) return failed(started);
  if (!started->backends)
    complain("Nothing reports for this client: the daemon has no configuration for its client type.");
  return finish(operationOf(options.command), call(session, options));
}

}  // namespace veltrad::ctl
