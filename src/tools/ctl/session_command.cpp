// SPDX-License-Identifier: Apache-2.0
// `veltractl session`: runs the lines of a session.
#include "tools/ctl/commands.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "tools/ctl/client_session.h"
#include "tools/ctl/line_reader.h"
#include "tools/ctl/print.h"
#include "tools/ctl/session_lines.h"

namespace veltrad::ctl {
namespace {

// The exit status, or nothing if the next line follows.
using Ended = std::optional<int>;

class SessionRun {
 public:
  SessionRun(ClientSession& session, Interrupt& interrupt) : _session(session), _interrupt(interrupt) {}

  Ended start() {
    const auto answer = _session.start();
    if (!answer) return 0;
    if (answer->status != VELTRA_OK) return refused(answer->error->description);
    return print(formatAnswer(Operation::start, *answer));
  }

  Ended run(std::uint64_t number, const std::string& text) {
    const auto line = parseSessionLine(text);
    if (!line) return malformed(number, line.error());
    const Operation operation = line.value().operation;
    const auto answer = answerTo(line.value());
    if (!answer) return 0;
    if (answer->status != VELTRA_OK) ++_unanswered;
    const Ended ended = print(formatAnswer(operation, *answer));
    if (ended || answer->status != VELTRA_NO_DAEMON) return ended;
    return refused(
        "The connection to the daemon has ended: see whether veltrad still runs, and start a new session.");
  }

  Ended malformed(std::uint64_t number, std::string_view description) {
    return print(formatMalformedLine(number, description));
  }

  // The exit status at the end of the input.
  int end() const {
    if (_unanswered == 0) return 0;
    return refused(fmt::format("Calls that ended without an answer: {}.", _unanswered));
  }

 private:
  // Nothing after an interruption.
  std::optional<Answer> answerTo(const SessionLine& line) {
    switch (line.operation) {
      case Operation::start:
      case Operation::restart:
        return _session.start();
      case Operation::send:
        return _session.send(line.fields);
      case Operation::oneShot:
        break;
      case Operation::flush:
        return _session.flush();
      case Operation::states: {
        const Dictionary* userInfo = line.fields.dictionary("userInfo");
        return _session.states(userInfo ? std::optional(*userInfo) : std::nullopt);
      }
      case Operation::displayURL:
        return _session.displayURL();
      case Operation::uploadFile:
        return _session.uploadFile(*line.fields.string("path"));
      case Operation::uploadLogData:
        return _session.uploadLogData(*line.fields.array("data"));
      case Operation::finish:
        return _session.finish();
      case Operation::sleep:
        if (_interrupt.wait(-1, line.duration) == Interrupt::Wake::interrupted) return std::nullopt;
        return Answer();
    }
    return std::nullopt;
  }

  static Ended print(const std::string& line) { return printLine(line) ? Ended() : Ended(1); }

  ClientSession& _session;
  Interrupt& _interrupt;
  std::uint64_t _unanswered = 0;
};

int runLines(SessionRun& run, LineReader& lines) {
  for (;;) {
    Ended ended;
    switch (lines.next()) {
      case LineReader::Got::line:
        if (!isBlankLine(lines.line())) ended = run.run(lines.number(), lines.line());
        break;
      case LineReader::Got::tooLong:
        ended = run.malformed(lines.number(),
                              fmt::format("the line is too long: expected at most {} bytes", kLongestLine));
        break;
      case LineReader::Got::end:
      case LineReader::Got::interrupted:
        return run.end();
      case LineReader::Got::failed:
        return refused(fmt::format("Cannot read the input: {}.", std::strerror(errno)), 2);
    }
    if (ended) return *ended;
  }
}

}  // namespace

int runSession(const Options& options, Interrupt& interrupt) {
  FileDescriptor file;
  if (options.input) {
    file = FileDescriptor(open(options.input->c_str(), O_RDONLY | O_CLOEXEC));
    if (file.get() < 0)
      return refused(fmt::format("--input {}: {}", *options.input, std::strerror(errno)), 2);
  }
  // If a copy cannot be printed, printing the next answer fails too, which ends the session.
  const auto printCopy = [](const AggregatedCopy& copy) {
    static_cast<void>(printLine(formatAggregated(copy)));
  };
  ClientSession session(interrupt, options.aggregate ? ClientSession::CopyHandler(printCopy) : nullptr);
  if (const auto problem = session.open(options.root, options.identity)) return refused(*problem);
  SessionRun run(session, interrupt);
  const Ended ended = run.start();
  LineReader lines(options.input ? file.get() : STDIN_FILENO, kLongestLine, interrupt);
  const int status = ended ? *ended : runLines(run, lines);
  if (const std::uint64_t lost = session.close())
    complain(fmt::format("Calls that were lost unsent: {}.", lost));
  return status;
}

}  // namespace veltrad::ctl
