// When a back end's ticks are and when its clean-up ends. On a time that the caller passes; one thread at a
// time.
#pragma once

#include <chrono>
#include <optional>

namespace veltrad::backends {

// Ticks stand at multiples of the period since the back end was made, and are needed only while datagrams
// wait or a clean-up is under way.
class DeliverySchedule {
 public:
  using Time = std::chrono::steady_clock::time_point;
  enum class Verdict { goOn, stop, lastResortScheduled };
  static constexpr std::chrono::milliseconds kLastResort{9500};

  // `period` is above 0.
  DeliverySchedule(Time made, std::chrono::milliseconds period) : _made(made), _period(period) {}

  // When to look again; none: not before a datagram waits.
  std::optional<Time> next(Time now, bool waiting);
  bool tickIsDue(Time now) const { return _nextTick && *_nextTick <= now; }
  bool lastResortIsDue(Time now) const { return _lastResort && *_lastResort <= now; }

  // The session lets go: stop when nothing waits, else when nothing waits any more.
  Verdict cleanup(bool waiting);
  // Somebody sends again: no clean-up is under way any more.
  void resume();
  // At the end of every tick.
  Verdict afterTick(Time now, bool waiting);

 private:
  enum CleanupState { notRequested = 0, requested = 1, lastResort = 2 };

  const Time _made;
  const std::chrono::milliseconds _period;
  std::optional<Time> _nextTick;
  CleanupState _cleanupState = notRequested;
  std::optional<Time> _lastResort;
};

}  // namespace veltrad::backends
