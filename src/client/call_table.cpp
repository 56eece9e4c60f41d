// SPDX-License-Identifier: Apache-2.0
// Calls that are waiting for their answers.
#include "client/call_table.h"

#include <algorithm>
#include <utility>
#include <vector>

namespace veltrad::client {

std::uint32_t CallTable::takeID() {
  do {
    ++_lastID;
  } while (_lastID == 0 || _calls.contains(_lastID));
  return _lastID;
}

void CallTable::add(std::uint32_t callID, Call call) {
  if (!call.waiter) ++_unwaited;
  _calls.emplace(callID, std::move(call));
}

void CallTable::answer(std::uint32_t callID, Answer answer) {
  const auto call = _calls.extract(callID);
  if (call.empty()) return;
  if (!call.mapped().waiter) --_unwaited;
  finish(call.mapped(), std::move(answer));
}

void CallTable::askForRemoval(std::uint32_t callID) {
  const auto at = _calls.find(callID);
  if (at != _calls.end() && at->second.file) at->second.file->askForRemoval();
}

void CallTable::addEvent(Dictionary event) {
  if (_readyEvents == kMostWaitingEvents) {
    ++_counts.dropped_events;
    return;
  }
  ++_readyEvents;
  _ready.push_back({nullptr, nullptr, nullptr, std::move(event)});
}

void CallTable::addChange(StateChange change) {
  _ready.push_back({nullptr, nullptr, nullptr, {}, std::make_unique<StateChange>(std::move(change))});
}

void CallTable::endAllBut(const std::unordered_set<std::uint32_t>& kept, veltra_status status,
                          const char* why) {
  std::vector<std::uint32_t> ended;
  for (const auto& [callID, call] : _calls) {
    if (!kept.contains(callID)) ended.push_back(callID);
  }
  // The difference orders IDs that have wrapped.
  std::sort(ended.begin(), ended.end(), [this](std::uint32_t a, std::uint32_t b) {
    return static_cast<std::int32_t>(a - _lastID) < static_cast<std::int32_t>(b - _lastID);
  });
  for (const std::uint32_t callID : ended) answer(callID, answerOfStatus(status, why));
}

void CallTable::takeReady(std::deque<Ready>& batch) {
  batch.swap(_ready);
  _readyEvents = 0;
}

void CallTable::finish(const Call& call, Answer answer) {
  answer->file = call.file;
  const bool came = answer->status == VELTRA_OK || answer->status == VELTRA_REFUSED;
  ++(came ? _counts.replies : _counts.unanswered);
  if (call.waiter) {
    call.waiter->answer = std::move(answer);
    call.waiter->changed.notifyOne();
  } else {
    _ready.push_back({call.callback, call.context, std::move(answer)});
  }
}

}  // namespace veltrad::client
