// SPDX-License-Identifier: Apache-2.0
// The phases of connecting: whether a session needs a connection, and when the next attempt is due. Used
// under a lock.
#pragma once

#include <chrono>
#include <optional>

namespace veltrad::client {

// Only decides: its user makes the attempts and reports their results.
class Reconnection {
 public:
  using Clock = std::chrono::steady_clock;
  using TimePoint = Clock::time_point;

  // waiting: there is no connection, and an attempt is due at nextStep(). greeting: connected, the daemon's
  // hello must come before nextStep(). starting: the session is being started again, so its calls still wait.
  // open: calls are written. over: no connection is wanted any more, which is final.
  enum class Phase { waiting, greeting, starting, open, over };

  // The wait before an attempt lies between these. It grows with each attempt that fails, and starts again
  // once the daemon has greeted.
  static constexpr std::chrono::milliseconds kShortestWait{100};
  static constexpr std::chrono::milliseconds kLongestWait{30'000};

  // `patience`: for the daemon's hello. `first` is waiting, with an attempt due at once, or open.
  Reconnection(Phase first, std::chrono::milliseconds patience) : _patience(patience), _phase(first) {}

  Phase phase() const { return _phase; }
  bool connected() const { return _phase != Phase::waiting && _phase != Phase::over; }
  // Absent if nothing is due at any time.
  std::optional<TimePoint> nextStep() const;
  bool due(TimePoint now) const;

  // The attempt has reached the socket.
  void attempted(TimePoint now);
  // The daemon has sent its hello; `starts` says whether the session must be started again.
  void greeted(bool starts);
  void started();
  // The attempt failed, or the connection has ended. `draw` is a random number from 0 to 1, which spreads the
  // attempts of many clients.
  void ended(TimePoint now, double draw);
  void giveUp() { _phase = Phase::over; }

 private:
  const std::chrono::milliseconds _patience;
  Phase _phase;
  // Attempts in a row that the daemon did not greet.
  int _failures = 0;
  // The distant past at first.
  TimePoint _next{};
};

}  // namespace veltrad::client
