// SPDX-License-Identifier: Apache-2.0
// Calls that are waiting for their answers.
#include "client/call_table.h"

#include <algorithm>
#include <utility>
#include <vector>

namespace veltrad::client {

std::uint32_t CallTable::freeID() const {
  std::uint32_t callID = _lastID;
  do {
    ++callID;
  } while (callID == 0 || _calls.contains(callID));
  return callID;
}

void CallTable::add(std::uint32_t callID, Call call) {
  _lastID = callID;
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

void CallTable::endAll(const char* why) {
  std::vector<std::pair<std::uint32_t, Call>> open(_calls.begin(), _calls.end());
  _calls.clear();
  _unwaited = 0;
  std::sort(open.begin(), open.end(), [](const auto& a, const auto& b) { return a.first < b.first; });
  for (const auto& [callID, call] : open) finish(call, answerOfStatus(VELTRA_NO_REPLY, why));
}

void CallTable::takeReady(std::deque<Ready>& batch) {
  batch.swap(_ready);
  _readyEvents = 0;
}

void CallTable::finish(const Call& call, Answer answer) {
  answer->file = call.file;
  ++(answer->status == VELTRA_NO_REPLY ? _counts.unanswered : _counts.replies);
  if (call.waiter) {
    call.waiter->answer = std::move(answer);
    call.waiter->changed.notifyOne();
  } else {
    _ready.push_back({call.callback, call.context, std::move(answer), {}});
  }
}

}  // namespace veltrad::client
