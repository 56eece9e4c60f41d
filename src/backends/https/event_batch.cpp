// SPDX-License-Identifier: Apache-2.0
// Keeps a batch within its bounds.
#include "backends/https/event_batch.h"

#include "formats/json.h"

namespace veltrad::backends {

EventSize sizeOfEvent(const Dictionary& event) {
  // During a flush there are the compact text, the readable text and the compressed body.
  constexpr std::size_t kTexts = 3;
  const std::size_t json = formats::jsonBytesAtMost(event);
  return {json, sizeof(Dictionary) + keptBytes(event) + kTexts * json};
}

std::optional<std::uint64_t> EventBatch::oldestTurn() const {
  if (_events.empty()) return std::nullopt;
  return _events.front().turn;
}

bool EventBatch::thresholdReached(std::int32_t method, std::int32_t threshold) const {
  const auto at = _counts.find(method);
  return (at == _counts.end() ? 0 : at->second) > threshold;
}

bool EventBatch::full(const EventSize& event) const {
  return _events.size() >= kMostEvents || _bytes.json + event.json > kMostBytes;
}

void EventBatch::add(std::int32_t method, Dictionary event, const EventSize& size, std::uint64_t turn,
                     std::uint64_t message) {
  account(size);
  _events.push_back({std::move(event), size, turn, message});
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
    event.fields.set("_sessionID", sessionID);
    event.size = sizeOfEvent(event.fields);
    account(event.size);
  }
}

std::vector<Dictionary> EventBatch::take() {
  _counts.clear();
  std::vector<Dictionary> taken;
  taken.reserve(_events.size());
  for (Event& event : _events) taken.push_back(std::move(event.fields));
  discard();
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
