// The events that wait for a flush, how many of each method, and how many bytes. Guarded by its owner.
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

// What an event costs, in bytes.
struct EventSize {
  std::size_t json = 0;  // of its JSON text, at most
  std::size_t charged =
      0;  // of memory: the event, and the texts and the compressed body that a flush makes of it
};
EventSize sizeOfEvent(const Dictionary& event);

class EventBatch {
 public:
  // Whatever the thresholds say, a batch holds no more: a storebag without limits must not grow the daemon
  // without end.
  static constexpr std::size_t kMostEvents = 4096;
  static constexpr std::size_t kMostBytes = 4u << 20;  // of JSON; what they keep is charged

  std::size_t size() const { return _events.size(); }
  std::size_t chargedBytes() const { return _bytes.charged; }
  // The turn that the oldest event was added with; nothing: there is none.
  std::optional<std::uint64_t> oldestTurn() const;

  // True when an event of this method may only be added after a flush: more than `threshold` were added since
  // the counts were last cleared. Signed comparison.
  bool thresholdReached(std::int32_t method, std::int32_t threshold) const;
  // True when the bound on events or bytes is reached.
  bool full(const EventSize& event) const;
  void add(std::int32_t method, Dictionary event, const EventSize& size, std::uint64_t turn);
  // The oldest one; none where the batch is empty.
  void dropOldest();
  // After a flush that a threshold caused, an event of the method counts from 0 whatever the flush did.
  void restartCount(std::int32_t method) { _counts[method] = 0; }

  void setSessionID(const std::string& sessionID);
  // Leaves it empty; the counts go too.
  std::vector<Dictionary> take();
  // Leaves it empty; the counts stay.
  void discard();

 private:
  struct Event {
    Dictionary fields;
    EventSize size;
    std::uint64_t turn;
  };
  void account(const EventSize& size);
  void unaccount(const EventSize& size);

  std::deque<Event> _events;
  EventSize _bytes;
  std::map<std::int32_t, std::int32_t> _counts;
};

}  // namespace veltrad::backends
