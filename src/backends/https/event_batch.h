// SPDX-License-Identifier: Apache-2.0
// The events that wait for a flush, with their number per method and their size. The owner guards it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <optional>
#include <string>

#include "backends/https/event.h"

namespace veltrad::backends {

// In bytes: of an event's JSON text, and of the memory for the event and what a flush makes of it.
struct EventSize {
  std::size_t json = 0;
  std::size_t charged = 0;
};
EventSize sizeOfEvent(const EventText& event);

class EventBatch {
 public:
  struct Event {
    EventText text;
    EventSize size;
    // MemoryAccount::nextTurn.
    std::uint64_t turn = 0;
    // See WrittenEvent; false after the user info or the filters have changed.
    bool settled = false;
    // Its message's, in the record of fates.
    std::uint64_t message = 0;
  };

  // The bounds of a batch, whatever the thresholds in the storebag are. Bytes are those of the JSON texts.
  static constexpr std::size_t kMostEvents = 4096;
  static constexpr std::size_t kMostBytes = 4u << 20;

  std::size_t size() const { return _events.size(); }
  std::size_t chargedBytes() const { return _bytes.charged; }
  // The turn with which the oldest event was added.
  std::optional<std::uint64_t> oldestTurn() const;

  // Whether a flush must come before the next event of a method, because more than `threshold` (signed) were
  // added since the counts were last cleared.
  static bool isReached(std::int32_t added, std::int32_t threshold) { return added > threshold; }
  bool thresholdReached(std::int32_t method, std::int32_t threshold) const;
  // Whether the event would exceed a bound.
  bool full(const EventSize& event) const;
  void add(std::int32_t method, Event event);
  // Returns the number of its message.
  std::uint64_t dropOldest();
  // Called after a flush that a threshold caused, whatever its result.
  void restartCount(std::int32_t method) { _counts[method] = 0; }

  void setSessionID(const std::string& sessionID);
  // Marks all events as not settled.
  void unsettle();
  // Returns the events and clears the counts.
  std::deque<Event> take();
  // Drops the events but keeps the counts.
  void discard();

 private:
  void account(const EventSize& size);
  void unaccount(const EventSize& size);

  std::deque<Event> _events;
  EventSize _bytes;
  std::map<std::int32_t, std::int32_t> _counts;
};

}  // namespace veltrad::backends
