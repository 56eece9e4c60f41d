// SPDX-License-Identifier: Apache-2.0
// Takes the property lists out of the daemon's answers.
#include "tools/ctl/contents_source.h"

#include <algorithm>

#include "base/property_list.h"
#include "tools/ctl/answer_fields.h"
#include "wire/limits.h"
#include "wire/names.h"

namespace veltrad::ctl {

namespace {
std::uint64_t unsignedNumber(const Dictionary& answer, const char* key) {
  return static_cast<std::uint64_t>(numberIn(answer, key));
}
}  // namespace

Result<Done, std::string> ContentsSource::readOn() {
  // Contents that arrive meanwhile are left for the next call; otherwise a busy daemon could keep this call
  // from ending.
  for (std::optional<std::uint64_t> end; !end || *_next < *end;) {
    Dictionary arguments;
    if (_next) arguments.set("from", *_next);
    const auto answer = _daemon.ask(wire::question::kContents, std::move(arguments));
    if (!answer) return Failure{answer.error()};
    if (!answer.value().array("contents")) return Failure{std::string("veltrad answered without contents.")};
    for (const Dictionary* piece : dictionariesIn(answer.value(), "contents")) take(*piece);
    _next = unsignedNumber(answer.value(), "next");
    if (!end) end = unsignedNumber(answer.value(), "end");
  }
  return Done();
}

void ContentsSource::take(const Dictionary& piece) {
  const Value* value = piece.find("contents");
  const Data* contents = value ? value->asData() : nullptr;
  const std::uint64_t message = unsignedNumber(piece, "message");
  _highest = std::max(_highest, message);
  if (!contents || contents->bytes.empty()) return;
  _bytes += contents->bytes.size();
  _held.insert_or_assign(message, contents->bytes);
  while (_bytes > kMostBytes) {
    _bytes -= _held.begin()->second.size();
    _held.erase(_held.begin());
  }
}

Result<std::optional<Dictionary>, std::string> ContentsSource::of(std::uint64_t message) {
  if (auto held = taken(message); held || message + kDisorder < _highest) return held;
  if (auto done = readOn(); !done) return Failure{done.error()};
  return taken(message);
}

std::optional<Dictionary> ContentsSource::taken(std::uint64_t message) {
  auto held = _held.extract(message);
  if (!held) return std::nullopt;
  _bytes -= held.mapped().size();
  auto parsed = parseBinaryPropertyList(held.mapped(), wire::kDaemonFrameLimits);
  return parsed ? std::move(parsed.value()).takeDictionary() : std::nullopt;
}

}  // namespace veltrad::ctl
