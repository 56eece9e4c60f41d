// SPDX-License-Identifier: Apache-2.0
// Takes the entries out of the daemon's answers.
#include "tools/ctl/fate_source.h"

#include <cstring>

#include "tools/ctl/answer_fields.h"
#include "wire/names.h"

namespace veltrad::ctl {

namespace {
constexpr std::size_t kEntryBytes = sizeof(std::uint64_t) + sizeof(wire::FateWords);

std::uint64_t positionIn(const Dictionary& answer, const char* key) {
  return static_cast<std::uint64_t>(numberIn(answer, key));
}
}  // namespace

Result<Done, std::string> FateSource::readOn(bool patient) {
  for (;;) {
    const auto answer = _daemon.ask(wire::question::kFates, {{"from", _next}, {"patient", patient}});
    if (!answer) return Failure{answer.error()};
    const std::uint64_t before = _next;
    if (auto done = read(answer.value()); !done) return done;
    _waits = _next < positionIn(answer.value(), "end");
    if (_next == before || !_waits) return Done();
  }
}

Result<Done, std::string> FateSource::read(const Dictionary& answer) {
  if (positionIn(answer, "layout") != wire::kFateLayout) {
    return Failure{std::string(
        "veltrad keeps its record in another form than this veltractl reads: restart veltrad after its "
        "update.")};
  }
  const Value* entries = answer.find("entries");
  const Data* data = entries ? entries->asData() : nullptr;
  if (!data) return Failure{std::string("veltrad answered without entries.")};
  const std::uint64_t refresh = positionIn(answer, "refresh"), size = positionIn(answer, "size");
  const std::uint64_t end = positionIn(answer, "end"), oldest = end > size ? end - size : 1;
  if (!_reader) {
    _messages = positionIn(answer, "messages");
    // A text is at most that much older than a session that names it, and the session than a message.
    _reader = std::make_unique<support::FateReader>(_listener, size);
  }
  for (std::size_t at = 0; at + kEntryBytes <= data->bytes.size(); at += kEntryBytes) {
    std::uint64_t position = 0;
    wire::FateWords words;
    std::memcpy(&position, data->bytes.data() + at, sizeof position);
    std::memcpy(words.data(), data->bytes.data() + at + sizeof position, sizeof words);
    if (position != _expected) {
      _missing += position - _expected;
      // Else a single entry was given up.
      if (_expected < oldest) _horizon = position + 2 * refresh;
    }
    _expected = position + 1;
    _reader->read(position, words);
  }
  _next = positionIn(answer, "next");
  return Done();
}

}  // namespace veltrad::ctl
