// SPDX-License-Identifier: Apache-2.0
// Computes when a back end's ticks are due and when its clean-up ends. Not thread-safe.
#pragma once

#include <chrono>
#include <optional>

namespace veltrad::backends {

// Ticks are at multiples of the period since the back end was made. They are needed only while datagrams wait
// or a clean-up is under way.
class DeliverySchedule {
 public:
  using Time = std::chrono::steady_clock::time_point;
  enum class Verdict { goOn, stop, lastResortScheduled };
  static constexpr std::chrono::milliseconds kLastResort{9500};

  // `period` is positive.
  DeliverySchedule(Time made, std::chrono::milliseconds period) : _made(made), _period(period) {}

  // When the next tick or the last resort is due; nothing if no tick is needed.
  std::optional<Time> next(Time now, bool waiting);
  bool tickIsDue(Time now) const { return _nextTick && *_nextTick <= now; }
  bool lastResortIsDue(Time now) const { return _lastResort && *_lastResort <= now; }

  // The session releases the back end, which stops as soon as nothing waits.
  Verdict cleanup(bool waiting);
  // Cancels a clean-up, because something is sent again.
  void resume();
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
