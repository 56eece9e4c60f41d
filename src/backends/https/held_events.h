// SPDX-License-Identifier: Apache-2.0
// A back end's batch with its memory charge. Any thread: the session's thread adds and takes events; other
// threads set a new session ID or drop the oldest events for newer ones of the same user.
#pragma once

#include <atomic>
#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <utility>

#include "backends/https/event_batch.h"
#include "backends/lock_ranks.h"
#include "base/mutex.h"
#include "platform/counters.h"
#include "platform/fate_writer.h"
#include "platform/memory_budget.h"

namespace veltrad::backends {

// Shared, because the account may use it after its back end has gone. The counters must outlive it.
class HeldEvents final : public platform::Evictable {
 public:
  // The charge pays for the events and for what a flush makes of them.
  struct Taken {
    std::deque<EventBatch::Event> events;
    platform::Charge charge;
    // In the record of fates.
    std::uint64_t batch = 0;
  };
  // Before the next event: there is room, its method's threshold requires a flush, or the batch is full.
  enum class Need { room, flush, bound };

  HeldEvents(platform::Counters& counters, const platform::FateWriter& pen)
      : _counters(counters), _pen(pen) {}
  // Counts the events that are lost, for example after a second start, or when user info never came.
  ~HeldEvents() override;

  std::size_t size() const;
  bool empty() const { return size() == 0; }
  Need needOf(std::int32_t method, std::int32_t threshold, const EventSize& size) const;
  // How often the session ID has changed. If the count is older, add() sets the current ID in the event.
  std::uint64_t sessionIDChanges() const { return _sessionIDChanges.load(std::memory_order_acquire); }
  // Drops the oldest events if the batch is full. `charge` pays for the event; `step` and `fate` are what the
  // record of fates says of it.
  void add(std::int32_t method, EventBatch::Event event, platform::Charge charge,
           std::uint64_t sessionIDChanges, wire::Step step, wire::StepEntry fate);
  void restartCount(std::int32_t method);
  void setSessionID(const std::string& sessionID);
  void unsettle();
  Taken take();
  // Counts the events that are dropped, and returns how many.
  std::size_t discard(wire::Reason why);

  std::optional<std::uint64_t> oldestTurn() const override;
  void dropOldest() override;

 private:
  void dropOldest(wire::Reason why) REQUIRES(_mutex);
  std::size_t settle() REQUIRES(_mutex);

  platform::Counters& _counters;
  const platform::FateWriter _pen;
  std::atomic<std::uint64_t> _sessionIDChanges{0};

  mutable Mutex _mutex BACKEND_LOCK;
  EventBatch _batch GUARDED_BY(_mutex);
  platform::Charge _charge GUARDED_BY(_mutex);
  // 0: none has begun.
  std::uint64_t _batchNumber GUARDED_BY(_mutex) = 0;
  // Empty before the first change.
  std::string _sessionID GUARDED_BY(_mutex);
};

}  // namespace veltrad::backends
