// SPDX-License-Identifier: Apache-2.0
// The events that wait for a flush, with their number per method and their size. The owner guards it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "base/value.h"

namespace veltrad::backends {

// Upper bounds in bytes: of an event's JSON text, and of the memory for the event and what a flush makes of
// it.
struct EventSize {
  std::size_t json = 0;
  std::size_t charged = 0;
};
EventSize sizeOfEvent(const Dictionary& event);

class EventBatch {
 public:
  // The bounds of a batch, whatever the thresholds in the storebag are. Bytes are those of the JSON texts.
  static constexpr std::size_t kMostEvents = 4096;
  static constexpr std::size_t kMostBytes = 4u << 20;

  std::size_t size() const { return _events.size(); }
  std::size_t jsonBytes() const { return _bytes.json; }
  std::size_t chargedBytes() const { return _bytes.charged; }
  // The turn with which the oldest event was added.
  std::optional<std::uint64_t> oldestTurn() const;

  // Whether a flush must come before the next event of this method, because more than `threshold` (signed)
  // were added since the counts were last cleared.
  bool thresholdReached(std::int32_t method, std::int32_t threshold) const;
  // Whether the event would exceed a bound.
  bool full(const EventSize& event) const;
  // `message`: its number in the record of fates.
  void add(std::int32_t method, Dictionary event, const EventSize& size, std::uint64_t turn,
           std::uint64_t message = 0);
  // Returns the number of its message.
  std::uint64_t dropOldest();
  // Called after a flush that a threshold caused, whatever its result.
  void restartCount(std::int32_t method) { _counts[method] = 0; }

  void setSessionID(const std::string& sessionID);
  // Returns the events and clears the counts.
  std::vector<Dictionary> take();
  // Drops the events but keeps the counts.
  void discard();

 private:
  struct Event {
    Dictionary fields;
    EventSize size;
    std::uint64_t turn;
    std::uint64_t message;
  };
  void account(const EventSize& size);
  void unaccount(const EventSize& size);

  std::deque<Event> _events;
  EventSize _bytes;
  std::map<std::int32_t, std::int32_t> _counts;
};

}  // namespace veltrad::backends
