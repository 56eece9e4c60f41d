// SPDX-License-Identifier: Apache-2.0
// `veltractl watch`: follows the record as it is written.
#include <fmt/format.h>

#include <chrono>
#include <set>

#include "base/null_value.h"
#include "formats/json.h"
#include "tools/ctl/commands.h"
#include "tools/ctl/contents_source.h"
#include "tools/ctl/fate_lines.h"
#include "tools/ctl/fate_source.h"
#include "tools/ctl/fate_text.h"
#include "tools/ctl/print.h"

namespace veltrad::ctl {

namespace {

constexpr std::chrono::milliseconds kLookAgain{100};

// Prints the messages that match the filter, from begin() on.
class Watcher final : public support::FateReader::Listener {
 public:
  // `contents` is null if they are not asked for.
  Watcher(const Options& options, ContentsSource* contents) : _options(options), _contents(contents) {}

  void begin() { _printing = true; }
  bool failed() const { return _failed; }
  // The number of printed messages whose contents were lost.
  std::uint64_t lostContents() const { return _lostContents; }

  void taken(const support::ToldMessage& message) override {
    if (!message.session || !fits(_options.care.fates, message)) return;
    // The messages with further steps. Beyond the bound the oldest are forgotten, which are long done.
    if (_told.size() == kMostTold) _told.erase(_told.begin());
    _told.insert(message.entry.message);
    if (!_printing) return;
    Dictionary line = lineOfMessage(message);
    line.set("event", "message");
    std::string text = textOfMessage(message);
    const bool isMessage = message.entry.item == wire::MessageEntry::Item::message;
    if (_contents && isMessage) addContents(message.entry.message, line, text);
    print(line, text);
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

  void lost(std::uint64_t entries, std::uint64_t contents) {
    Dictionary line{{"event", "lost"}, {"entries", entries}};
    std::string text = fmt::format("{} entries were overwritten before they could be read", entries);
    if (_contents) {
      line.set("contents", contents);
      text += fmt::format(", and the contents of {} messages", contents);
    }
    print(line, text);
  }

 private:
  static constexpr std::size_t kMostTold = 1u << 20;

  void addContents(std::uint64_t message, Dictionary& line, std::string& text) {
    const auto found = _contents->of(message);
    if (!found) {
      complain(found.error());
      _failed = true;
      return;
    }
    const auto& contents = found.value();
    if (!contents) {
      ++_lostContents;
      line.set("contentsLost", true);
      text += "\n  its contents are lost";
    }
    for (const char* key : {"payload", "userInfo"}) {
      const Dictionary* held = contents ? contents->dictionary(key) : nullptr;
      line.set(key, held ? Value(*held) : nullValue());
      if (held) text += fmt::format("\n  {} {}", key, formats::writeJSON(*held));
    }
  }

  void print(const Dictionary& line, const std::string& text) {
    if (!_failed) _failed = !printLine(_options.json ? formats::writeJSON(line) : text);
  }

  const Options& _options;
  ContentsSource* const _contents;
  std::uint64_t _lostContents = 0;
  bool _printing = false;
  bool _failed = false;
  std::set<std::uint64_t> _told;
};

}  // namespace

int runWatch(ControlClient& daemon, const Options& options, Interrupt& interrupt) {
  ContentsSource contents(daemon);
  Watcher watcher(options, options.care.contents ? &contents : nullptr);
  FateSource source(daemon, watcher);
  const auto readOn = [&](bool patient) {
    auto done = source.readOn(patient);
    // Also reads contents that were not asked for, so that newer ones are not lost.
    return done && options.care.contents ? contents.readOn() : std::move(done);
  };
  interrupt.begin();
  // The daemon keeps contents from now on, before the first message is printed.
  Result<Done, std::string> done = options.care.contents ? contents.readOn() : Done();
  // Reads the earlier entries first, because later ones refer to them.
  if (done) done = readOn(true);
  std::uint64_t missing = source.missing(), lost = 0;
  watcher.begin();
  while (done && !watcher.failed() && interrupt.wait(-1, kLookAgain) != Interrupt::Wake::interrupted) {
    done = readOn(!source.waits());
    if (source.missing() > missing || watcher.lostContents() > lost)
      watcher.lost(source.missing() - missing, watcher.lostContents() - lost);
    missing = source.missing();
    lost = watcher.lostContents();
  }
  if (!done) complain(done.error());
  return done && !watcher.failed() ? 0 : 1;
}

}  // namespace veltrad::ctl
