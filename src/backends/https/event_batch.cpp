// SPDX-License-Identifier: Apache-2.0
// Keeps a batch within its bounds.
#include "backends/https/event_batch.h"

#include <utility>

namespace veltrad::backends {

EventSize sizeOfEvent(const EventText& event) {
  // A flush makes a body, which may be as long as the text, and a readable text, where each field and the
  // event's two brackets have a line of their own.
  constexpr std::size_t kLine = 8, kBrackets = 2, kTexts = 2;
  const std::size_t json = event.json.size();
  return {json, sizeof(EventBatch::Event) + keptBytes(event.json) + kTexts * json +
                    kLine * (event.fields + kBrackets)};
}

std::optional<std::uint64_t> EventBatch::oldestTurn() const {
  if (_events.empty()) return std::nullopt;
  return _events.front().turn;
}

bool EventBatch::thresholdReached(std::int32_t method, std::int32_t threshold) const {
  const auto at = _counts.find(method);
  return isReached(at == _counts.end() ? 0 : at->second, threshold);
}

bool EventBatch::full(const EventSize& event) const {
  return _events.size() >= kMostEvents || _bytes.json + event.json > kMostBytes;
}

void EventBatch::add(std::int32_t method, Event event) {
  account(event.size);
  _events.push_back(std::move(event));
  ++_counts[method];
}

std::uint64_t EventBatch::dropOldest() {
  if (_events.empty()) return 0;
  const std::uint64_t message = _events.front().message;
  unaccount(_events.front().size);
  _events.pop_front();
  return message;
}

void EventBatch::setSessionID(const std::string& sessionID) {
  for (Event& event : _events) {
    unaccount(event.size);
    changeEvent(event.text, [&](Dictionary& fields) { fields.set("_sessionID", sessionID); });
    event.size = sizeOfEvent(event.text);
    account(event.size);
  }
}

void EventBatch::unsettle() {
  for (Event& event : _events) event.settled = false;
}

std::deque<EventBatch::Event> EventBatch::take() {
  _counts.clear();
  std::deque<Event> taken;
  taken.swap(_events);
  _bytes = {};
  return taken;
}

void EventBatch::discard() {
  std::deque<Event>().swap(_events);
  _bytes = {};
}

void EventBatch::account(const EventSize& size) {
  _bytes.json += size.json;
  _bytes.charged += size.charged;
}

void EventBatch::unaccount(const EventSize& size) {
  _bytes.json -= size.json;
  _bytes.charged -= size.charged;
}

}  // namespace veltrad::backends
