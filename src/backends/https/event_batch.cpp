// The batch's counts and bounds.
#include "backends/https/event_batch.h"

namespace veltrad {

bool EventBatch::thresholdReached(std::int32_t method, std::int32_t threshold) const {
  const auto at = _counts.find(method);
  return (at == _counts.end() ? 0 : at->second) > threshold;
}

std::size_t EventBatch::roughBytes(const Dictionary& event) {
  std::size_t bytes = 0;
  for (const auto& [key, value] : event) {
    bytes += key.size() + 16;
    if (const std::string* text = value.asString()) bytes += text->size();
  }
  return bytes;
}

bool EventBatch::full(const Dictionary& event) const {
  return _events.size() >= kMostEvents || _bytes + roughBytes(event) > kMostBytes;
}

void EventBatch::add(std::int32_t method, Dictionary event) {
  _exists = true;
  _bytes += roughBytes(event);
  _events.push_back(std::move(event));
  ++_counts[method];
}

void EventBatch::dropOldest() {
  if (_events.empty()) return;
  _bytes -= roughBytes(_events.front());
  _events.erase(_events.begin());
}

void EventBatch::setSessionID(const std::string& sessionID) {
  for (Dictionary& event : _events) event.set("_sessionID", sessionID);
}

std::vector<Dictionary> EventBatch::take() {
  _counts.clear();
  std::vector<Dictionary> taken = std::move(_events);
  discard();
  return taken;
}

void EventBatch::discard() {
  _exists = false;
  _events.clear();
  _bytes = 0;
}

}  // namespace veltrad
