// SPDX-License-Identifier: Apache-2.0
// Makes the reply to a message.
#include "ipc/sent_frame.h"

#include <utility>
#include <vector>

#include "wire/frame.h"
#include "wire/names.h"

namespace veltrad::ipc {

namespace key = wire::key;

namespace {
Dictionary dictionaryOf(const wire::Outcome& outcome) {
  const wire::Reason reason = outcome.decision.reason;
  std::vector<Dictionary::Entry> entries;
  entries.reserve(4);
  entries.emplace_back(key::kBackend, outcome.backend);
  entries.emplace_back(key::kOutcome, wire::nameOf(outcome.decision.fate));
  entries.emplace_back(key::kReason, wire::entryOf(reason).name);
  entries.emplace_back(key::kText, wire::causeOf(reason));
  return Dictionary::fromEntries(std::move(entries));
}
}  // namespace

Dictionary SentFrame::resultsOf(const wire::Outcomes& outcomes) {
  Array encoded;
  encoded.reserve(outcomes.size());
  for (const wire::Outcome& outcome : outcomes) encoded.push_back(dictionaryOf(outcome));
  Dictionary results;
  results.set(key::kOutcomes, std::move(encoded));
  return results;
}

const std::string& SentFrame::of(std::uint32_t callID, const wire::Outcomes& outcomes) {
  if (_frame.empty() || outcomes != _outcomes) {
    _frame.clear();  // in case that memory is short
    _outcomes = outcomes;
    _frame = wire::makeFrame(wire::FrameKind::reply, callID, {{key::kResults, resultsOf(outcomes)}});
    return _frame;
  }
  wire::FrameHeader header = wire::decodeFrameHeader(_frame.data());
  header.callID = callID;
  wire::encodeFrameHeader(header, _frame.data());
  return _frame;
}

}  // namespace veltrad::ipc
