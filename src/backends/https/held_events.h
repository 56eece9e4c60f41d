// A back end's batch with what it is charged. Any thread: the session's adds and takes, others give the
// events a new session ID or drop the oldest for newer ones of the same user.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "backends/https/event_batch.h"
#include "backends/lock_ranks.h"
#include "base/mutex.h"
#include "platform/memory_budget.h"

namespace veltrad::platform {
class Counters;
}  // namespace veltrad::platform

namespace veltrad::backends {

// Shared, so that the account may still ask it when its back end has gone. The counters outlive it.
class HeldEvents final : public platform::Evictable {
 public:
  struct Taken {
    std::vector<Dictionary> events;
    platform::Charge charge;  // of the events and of what is made of them
  };
  enum class Need {
    room,   // none: it may be added
    flush,  // its method's threshold is reached
    bound,  // the batch is full
  };

  explicit HeldEvents(platform::Counters& counters) : _counters(counters) {}
  // Counts what still waited: a second start, or user info that never came, lets the events go.
  ~HeldEvents() override;

  std::size_t size() const;
  bool empty() const { return size() == 0; }
  Need needOf(std::int32_t method, std::int32_t threshold, const EventSize& size) const;
  // How often the session ID has changed; add() with an older count gives the event the present one.
  std::uint64_t sessionIDChanges() const { return _sessionIDChanges.load(std::memory_order_acquire); }
  // Makes room by dropping the oldest where the batch is full. `charge` pays for the event.
  void add(std::int32_t method, Dictionary event, const EventSize& size, platform::Charge charge,
           std::uint64_t turn, std::uint64_t sessionIDChanges);
  void restartCount(std::int32_t method);
  void setSessionID(const std::string& sessionID);
  Taken take();
  // How many there were.
  std::size_t discard();

  std::optional<std::uint64_t> oldestTurn() const override;
  void dropOldest() override;

 private:
  std::size_t settle() REQUIRES(_mutex);

  platform::Counters& _counters;
  std::atomic<std::uint64_t> _sessionIDChanges{0};

  mutable Mutex _mutex BACKEND_LOCK;
  EventBatch _batch GUARDED_BY(_mutex);
  platform::Charge _charge GUARDED_BY(_mutex);
  std::string _sessionID GUARDED_BY(_mutex);  // since the first change
};

}  // namespace veltrad::backends
