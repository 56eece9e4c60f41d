// SPDX-License-Identifier: Apache-2.0
// The events of a simulation, in the order of their times: a list for each quarter of a second.
#pragma once

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <vector>

namespace veltrad::simulate {

// A quarter of a second, from the start of the simulation.
using Tick = std::uint32_t;
inline constexpr Tick kTicksPerSecond = 4;

inline double secondsOf(Tick tick) {
  return static_cast<double>(tick) / kTicksPerSecond;
}
// The first tick that is not before.
inline Tick tickAt(double seconds) {
  constexpr double kNever = 1e9;
  return static_cast<Tick>(std::ceil(std::clamp(seconds * kTicksPerSecond, 0.0, kNever)));
}

enum class Kind : std::uint8_t {
  incidentBegins,  // `device` is the number of the incident
  incidentEnds,
  sample,
  boot,
  refresh,
  message,
  sessionBegins,
  sessionEnds,
  datagramTick,
  spoolTry,
};

struct Event {
  std::uint32_t device = 0;
  Kind kind = Kind::sample;
  std::uint8_t start = 0;  // of the device that it is for: what an earlier start has planned does not happen
  std::uint16_t extra = 0;
};

class Calendar {
 public:
  // Events after `end` are dropped.
  explicit Calendar(Tick end) : _lists(end) {}

  Tick now() const { return _now; }
  double seconds() const { return secondsOf(_now); }
  // Adds an event; an event in the past happens now.
  void add(Tick at, Event event) {
    at = std::max(at, _now);
    if (at < _lists.size()) _lists[at].push_back(event);
  }
  void addIn(double seconds, Event event) { add(_now + tickAt(seconds), event); }

  // Calls `happen` for each event. It may add more, also for now.
  template <typename Happen>
  void run(Happen happen) {
    for (; _now < _lists.size(); ++_now) {
      for (std::size_t at = 0; at < _lists[_now].size(); ++at) {
        const Event event = _lists[_now][at];  // a copy, because the list may grow
        happen(event);
      }
      std::vector<Event>().swap(_lists[_now]);
    }
  }

 private:
  std::vector<std::vector<Event>> _lists;
  Tick _now = 0;
};

}  // namespace veltrad::simulate
