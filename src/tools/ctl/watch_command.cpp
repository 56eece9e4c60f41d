// SPDX-License-Identifier: Apache-2.0
// Follows the record as it is written.
#include <fmt/format.h>

#include <chrono>
#include <unordered_set>

#include "formats/json.h"
#include "tools/ctl/fate_lines.h"
#include "tools/ctl/fate_source.h"
#include "tools/ctl/fate_text.h"
#include "tools/ctl/print.h"
#include "tools/ctl/why_command.h"

namespace veltrad::ctl {

namespace {

constexpr std::chrono::milliseconds kLookAgain{100};

// Prints what fits, from begin() on.
class Watcher final : public support::FateReader::Listener {
 public:
  explicit Watcher(const Options& options) : _options(options) {}

  void begin() { _printing = true; }
  bool failed() const { return _failed; }

  void taken(const support::ToldMessage& message) override {
    if (!message.session || !fits(_options.care.fates, message)) return;
    // Those with steps still to come. What is forgotten here is of messages long done.
    if (_told.size() == kMostTold) _told.clear();
    _told.insert(message.entry.message);
    if (!_printing) return;
    Dictionary line = lineOfMessage(message);
    line.set("event", "message");
    print(line, textOfMessage(message));
  }

  void stepped(const support::ToldStep& step) override {
    using wire::Step;
    const std::string backend(wire::kBackendNames[step.entry.backend]);
    const auto& wanted = _options.care.fates.backend;
    const bool silent = step.entry.step == Step::none || step.entry.step == Step::restored;
    if (!_printing || silent || !_told.contains(step.message)) return;
    if (wanted && !backend.empty() && *wanted != backend) return;
    const std::uint64_t message = step.message & ~wire::kNoMessage;
    Dictionary line = lineOfStep(step);
    line.merge({{"event", "step"}, {"message", message}});
    line.set("backend", backend.empty() ? nullValue() : Value(backend));
    print(line, textOfStep(step, fmt::format("{}{}{}", message, backend.empty() ? "" : " ", backend)));
  }

  void lost(std::uint64_t entries) {
    print({{"event", "lost"}, {"entries", entries}},
          fmt::format("{} entries were overwritten before they could be read", entries));
  }

 private:
  static constexpr std::size_t kMostTold = 1u << 20;

  void print(const Dictionary& line, const std::string& text) {
    if (!_failed) _failed = !printLine(_options.json ? formats::writeJSON(line) : text);
  }

  const Options& _options;
  bool _printing = false;
  bool _failed = false;
  std::unordered_set<std::uint64_t> _told;
};

}  // namespace

int runWatch(const Options& options, Interrupt& interrupt) {
  auto daemon = ControlClient::connect(options.root);
  if (!daemon) {
    complain(daemon.error());
    return 1;
  }
  Watcher watcher(options);
  FateSource source(daemon.value(), watcher);
  interrupt.begin();
  // What was written before says what later entries mean.
  auto done = source.readOn(true);
  std::uint64_t missing = source.missing();
  watcher.begin();
  while (done && !watcher.failed() && interrupt.wait(-1, kLookAgain) != Interrupt::Wake::interrupted) {
    done = source.readOn(!source.waits());
    if (source.missing() > missing) watcher.lost(source.missing() - missing);
    missing = source.missing();
  }
  if (!done) complain(done.error());
  return done && !watcher.failed() ? 0 : 1;
}

}  // namespace veltrad::ctl
